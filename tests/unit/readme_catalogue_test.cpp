// The README's tables of options and events, row by row, against the
// catalogue the library registers: code and user guide cannot drift apart.
#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "host/catalogue.hpp"

#ifdef SORVEL_README
namespace {

namespace catalogue = sorvel::catalogue;

// The cells of every table row under the heading, up to the next heading.
std::vector<std::vector<std::string>> table_under(const std::string& heading) {
    std::ifstream file(SORVEL_README);
    std::vector<std::vector<std::string>> rows;
    bool inside = false;
    for (std::string line; std::getline(file, line);) {
        if (line.rfind('#', 0) == 0) {
            inside = line == heading;
        } else if (inside && line.rfind("| ", 0) == 0 && line.rfind("|--", 0) != 0) {
            std::vector<std::string> cells;
            std::istringstream in(line.substr(1));
            for (std::string cell; std::getline(in, cell, '|');) {
                cells.push_back(cell.substr(1, cell.size() - 2));
            }
            rows.push_back(cells);
        }
    }
    return rows.empty() ? rows : std::vector(rows.begin() + 1, rows.end());  // without the header row
}

std::string quoted(std::string_view text) {
    return '"' + std::string(text) + '"';
}

TEST(Readme, EventTableIsTheCatalogue) {
    const auto rows = table_under("### Events");
    ASSERT_EQ(rows.size(), catalogue::kEvents.size());
    const std::map<catalogue::Kind, std::string> kinds{{catalogue::Kind::condition, "condition"},
                                                       {catalogue::Kind::action, "action"},
                                                       {catalogue::Kind::expression, "expression"}};
    const std::map<std::string, std::vector<catalogue::Value>> params{
        {"—", {}},
        {"integer", {catalogue::Value::integer}},
        {"integer position", {catalogue::Value::integer}},
        {"float", {catalogue::Value::floating}},
        {"string", {catalogue::Value::string}},
        {"file name, integer", {catalogue::Value::string, catalogue::Value::integer}}};
    const std::map<std::string, std::uint16_t> results{{"integer", catalogue::kIntegerResult},
                                                       {"float", catalogue::kFloatResult},
                                                       {"string", catalogue::kStringResult}};
    for (std::size_t i = 0; i < rows.size(); ++i) {
        const catalogue::Event& e = catalogue::kEvents[i];
        const auto& row = rows[i];
        SCOPED_TRACE(row[1]);
        ASSERT_EQ(row.size(), 5U);
        EXPECT_EQ(row[0], kinds.at(e.kind));
        EXPECT_EQ(row[1], quoted(e.display));
        ASSERT_TRUE(params.count(row[2]));
        const auto& want = params.at(row[2]);
        ASSERT_EQ(want.size(), e.param_count);
        for (std::size_t p = 0; p < want.size(); ++p) {
            EXPECT_EQ(want[p], e.params[p].value);
        }
        if (e.kind == catalogue::Kind::expression) {
            ASSERT_TRUE(results.count(row[3]));
            EXPECT_EQ(results.at(row[3]), e.info);
        } else {
            EXPECT_EQ(row[3], e.kind == catalogue::Kind::condition ? "true/false" : "—");
        }
    }
}

TEST(Readme, OptionTableIsTheCatalogue) {
    const auto rows = table_under("### The two options");
    ASSERT_EQ(rows.size(), 2U);
    for (std::size_t i = 0; i < rows.size(); ++i) {
        EXPECT_EQ(rows[i][0], quoted(catalogue::kOptions[i].name));
    }
}

}  // namespace
#endif
