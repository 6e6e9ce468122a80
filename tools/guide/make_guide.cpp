// sorvel-guide: writes the game developers' guide of the release archive,
// in plain text, from the README's user guide (installing, the two options,
// the events, the results at the edges). Every event comes from the
// catalogue, in its order, with its display string and the titles the host
// asks its parameters with; the README's row of the same event gives its
// parameters, result and what it does. A README whose event or option table
// does not match the catalogue row by row (kind, display string, parameter
// kinds, result) gets no guide, so that code and documentation cannot drift.
//
//   sorvel-guide README.md VERSION OUTPUT
#include <cstdio>
#include <fstream>
#include <map>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "host/catalogue.hpp"

namespace {

namespace cat = sorvel::catalogue;

std::string trim(const std::string& s) {
    const auto begin = s.find_first_not_of(' ');
    return begin == std::string::npos ? "" : s.substr(begin, s.find_last_not_of(' ') - begin + 1);
}

// Markdown to plain text: code spans lose their backticks.
std::string plain(std::string s) {
    std::erase(s, '`');
    return s;
}

// The lines of a "### TITLE" section, up to the next heading.
std::vector<std::string> section(const std::vector<std::string>& readme, const std::string& title) {
    std::vector<std::string> out;
    bool inside = false;
    for (const std::string& line : readme) {
        if (line.rfind('#', 0) == 0) {
            if (inside) {
                break;
            }
            inside = line == "### " + title;
        } else if (inside) {
            out.push_back(line);
        }
    }
    while (!out.empty() && trim(out.front()).empty()) {
        out.erase(out.begin());
    }
    while (!out.empty() && trim(out.back()).empty()) {
        out.pop_back();
    }
    if (out.empty()) {
        throw std::runtime_error("README.md has no section \"### " + title + "\"");
    }
    return out;
}

// The body rows of the section's table, each cell trimmed.
std::vector<std::vector<std::string>> table(const std::vector<std::string>& lines) {
    std::vector<std::vector<std::string>> rows;
    for (const std::string& line : lines) {
        if (line.rfind('|', 0) != 0) {
            continue;
        }
        std::vector<std::string> cells;
        std::istringstream in(line.substr(1));
        for (std::string cell; std::getline(in, cell, '|');) {
            cells.push_back(trim(cell));
        }
        rows.push_back(cells);
    }
    if (rows.size() < 2) {
        throw std::runtime_error("a table without rows");
    }
    rows.erase(rows.begin(), rows.begin() + 2);  // the header and its rule
    return rows;
}

// The README's first paragraph: what the library is.
std::string intro(const std::vector<std::string>& readme) {
    std::string out;
    std::size_t i = 0;
    while (i < readme.size() && (readme[i].empty() || readme[i][0] == '#')) {
        ++i;
    }
    for (; i < readme.size() && !readme[i].empty(); ++i) {
        out += plain(readme[i]) + "\n";
    }
    return out;
}

// The section's text, with `items` in place of its table.
std::string prose(const std::vector<std::string>& lines, const std::string& items = "") {
    std::string out;
    bool in_table = false;
    for (const std::string& line : lines) {
        const bool row = line.rfind('|', 0) == 0;
        if (row && !in_table) {
            out += items;
        } else if (!row) {
            out += plain(line) + "\n";
        }
        in_table = row;
    }
    return out;
}

// A table cell as an indented paragraph of lines of at most 80 columns.
std::string wrap(const std::string& text) {
    constexpr std::size_t kWidth = 80;
    const std::string indent = "    ";
    std::string out, line = indent;
    std::istringstream words(plain(text));
    for (std::string word; words >> word;) {
        if (line.size() > indent.size() && line.size() + 1 + word.size() > kWidth) {
            out += line + "\n";
            line = indent;
        }
        line += (line.size() > indent.size() ? " " : "") + word;
    }
    return out + line + "\n";
}

const char* kind_name(cat::Kind k) {
    switch (k) {
        case cat::Kind::condition: return "condition";
        case cat::Kind::action: return "action";
        case cat::Kind::expression: return "expression";
    }
    return "?";
}

void check(bool ok, const std::string& what) {
    if (!ok) {
        throw std::runtime_error("README.md and the catalogue disagree: " + what);
    }
}

std::string events(const std::vector<std::string>& lines) {
    const auto rows = table(lines);
    check(rows.size() == cat::kEvents.size(),
          std::to_string(rows.size()) + " rows in the event table, " + std::to_string(cat::kEvents.size()) + " events");
    std::string items;
    for (std::size_t i = 0; i < rows.size(); ++i) {
        const cat::Event& e = cat::kEvents[i];
        const std::vector<std::string>& row = rows[i];
        const std::string display = "\"" + std::string(e.display) + "\"";
        check(row.size() >= 5, "row " + std::to_string(i + 1) + " has too few columns");
        check(row[0] == kind_name(e.kind) && row[1] == display, "row " + std::to_string(i + 1) + " is " + row[0] + " " +
                                                                    row[1] + ", not " + kind_name(e.kind) + " " +
                                                                    display);
        // The parameters' kinds and the result, as the README words them.
        static constexpr const char* kValueWords[] = {"integer", "float", "string"};
        std::string titles, kinds;
        for (std::size_t p = 0; p < e.param_count; ++p) {
            titles += (p == 0 ? "" : ", ") + ("\"" + std::string(e.params[p].title) + "\"");
            kinds += (p == 0 ? "" : ", ") + std::string(kValueWords[static_cast<int>(e.params[p].value)]);
        }
        const std::string result = e.kind == cat::Kind::condition ? "true/false"
                                   : e.kind == cat::Kind::action  ? "—"
                                   : e.info == cat::kFloatResult  ? "float"
                                   : e.info == cat::kStringResult ? "string"
                                                                  : "integer";
        // The README names two kinds by their use.
        const std::string given = row[2] == "integer position"     ? "integer"
                                  : row[2] == "file name, integer" ? "string, integer"
                                                                   : row[2];
        check(given == (kinds.empty() ? "—" : kinds) && row[3] == result,
              "row " + std::to_string(i + 1) + " gives parameters " + row[2] + " and result " + row[3] + ", not " +
                  kinds + " and " + result);
        items += std::string(kind_name(e.kind)) + " " + display + "\n";
        if (e.param_count != 0) {
            items += wrap("parameters: " + row[2] + " (asked as " + titles + ")");
        }
        if (e.kind != cat::Kind::action) {
            items += wrap("result: " + row[3]);
        }
        items += wrap(row[4]) + "\n";
    }
    return prose(lines, items);
}

std::string options(const std::vector<std::string>& lines) {
    const auto rows = table(lines);
    std::string items;
    std::size_t n = 0;
    for (; cat::kOptions[n].name != nullptr; ++n) {
        const std::string name = "\"" + std::string(cat::kOptions[n].name) + "\"";
        check(n < rows.size() && rows[n].size() >= 2 && rows[n][0] == name, "option " + name);
        items += name + "\n" + wrap(rows[n][1]) + "\n";
    }
    check(n == rows.size(), std::to_string(rows.size()) + " rows in the option table");
    return prose(lines, items);
}

std::string heading(const std::string& title, char rule) {
    return title + "\n" + std::string(title.size(), rule) + "\n\n";
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 4) {
        std::fprintf(stderr, "usage: sorvel-guide README.md VERSION OUTPUT\n");
        return 2;
    }
    try {
        std::ifstream in(argv[1]);
        if (!in) {
            throw std::runtime_error(std::string("cannot read ") + argv[1]);
        }
        std::vector<std::string> readme;
        for (std::string line; std::getline(in, line);) {
            readme.push_back(line);
        }
        const std::string version = argv[2];
        std::string guide = heading("Sorvel " + version + ": a guide for game developers", '=');
        guide += intro(readme) + "\n";
        std::string installing = prose(section(readme, "Installing the DLL"));
        for (std::size_t at; (at = installing.find("VERSION")) != std::string::npos;) {
            installing.replace(at, 7, version);
        }
        guide += heading("Installing", '-') + installing + "\n";
        guide += heading("The two options", '-') + options(section(readme, "The two options")) + "\n";
        guide += heading("Events", '-') + events(section(readme, "Events")) + "\n";
        guide += heading("Results at the edges", '-') + prose(section(readme, "Results at the edges"));
        guide += "\nSorvel " + version + ". Licence: see LICENSE. Checksums: SHA256SUMS.\n";
        for (std::size_t at; (at = guide.find("\n\n\n")) != std::string::npos;) {
            guide.erase(at, 1);  // one blank line between paragraphs
        }
        std::ofstream out(argv[3], std::ios::binary);
        if (!(out << guide) || !out.flush()) {
            throw std::runtime_error(std::string("cannot write ") + argv[3]);
        }
    } catch (const std::exception& e) {
        std::fprintf(stderr, "sorvel-guide: %s\n", e.what());
        return 1;
    }
    return 0;
}
