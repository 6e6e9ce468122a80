#include "model.hpp"

#include <cstdio>
#include <cstdlib>
#include <utility>

namespace sorvel::test::model {
namespace {

[[noreturn]] void model_bug(const char* what) {
    std::fprintf(stderr, "fuzz model: %s\n", what);
    std::abort();
}

// The value that a host string parameter stands for: none for a null
// pointer, else the bytes before the first zero byte.
std::optional<std::string> c_string(const Instance::Text& text) {
    if (!text) {
        return std::nullopt;
    }
    return text->substr(0, text->find('\0'));
}

template <class V, class Compare>
bool tree_contains(const Collection<V>& c, const V& p, Compare compare) {
    int at = c.root;
    while (at != kNone) {
        const int sign = compare(p, c.at(at).value);
        if (sign == 0) {
            return true;
        }
        at = sign > 0 ? c.at(at).right : c.at(at).left;
    }
    return false;
}

// Leaf insertion: the count goes up and the node is made before any
// comparison; a duplicate undoes both.
template <class V, class Compare>
void tree_add(Collection<V>& c, const V& p, bool indexed, Compare compare) {
    c.count += 1;
    c.nodes.push_back(Node<V>{p, kNone, kNone});
    const int fresh = static_cast<int>(c.nodes.size()) - 1;
    if (c.root == kNone) {
        c.root = fresh;
    } else {
        int at = c.root;
        for (;;) {
            const int sign = compare(p, c.at(at).value);
            if (sign == 0) {
                c.count -= 1;
                c.nodes.pop_back();
                return;
            }
            int& link = sign > 0 ? c.at(at).right : c.at(at).left;
            if (link == kNone) {
                link = fresh;
                break;
            }
            at = link;
        }
    }
    if (indexed) {
        c.index.push_back(fresh);
    }
}

// Hangs the whole subtree rooted at `subtree` on the first null link met
// when walking down from `start`, comparing only the subtree's root value.
template <class V, class Compare>
void reinsert_subtree(Collection<V>& c, int subtree, int start, Compare compare) {
    int at = start;
    for (;;) {
        const int sign = compare(c.at(subtree).value, c.at(at).value);
        if (sign == 0) {
            model_bug("a re-inserted subtree met its own value");
        }
        int& link = sign > 0 ? c.at(at).right : c.at(at).left;
        if (link == kNone) {
            link = subtree;
            return;
        }
        at = link;
    }
}

template <class V, class Compare>
void tree_remove(Collection<V>& c, const V& p, bool indexed, Compare compare) {
    c.count -= 1;
    if (c.root == kNone) {
        c.count += 1;
        return;
    }
    int removed = kNone;
    if (compare(c.at(c.root).value, p) == 0) {
        removed = c.root;
        const int left = c.at(removed).left;
        const int right = c.at(removed).right;
        c.root = kNone;
        if (left != kNone) {
            c.root = left;
            if (right != kNone) {
                reinsert_subtree(c, right, c.root, compare);
            }
        } else {
            c.root = right;
        }
    } else {
        int parent = kNone;
        bool went_right = false;
        int at = c.root;
        for (;;) {
            const int sign = compare(p, c.at(at).value);
            if (sign == 0) {
                break;
            }
            const int next = sign > 0 ? c.at(at).right : c.at(at).left;
            if (next == kNone) {
                c.count += 1;
                return;
            }
            parent = at;
            went_right = sign > 0;
            at = next;
        }
        removed = at;
        if (went_right) {
            c.at(parent).right = kNone;
        } else {
            c.at(parent).left = kNone;
        }
        if (c.at(removed).left != kNone) {
            reinsert_subtree(c, c.at(removed).left, c.root, compare);
        }
        if (c.at(removed).right != kNone) {
            reinsert_subtree(c, c.at(removed).right, c.root, compare);
        }
    }
    c.at(removed).left = kNone;
    c.at(removed).right = kNone;
    if (indexed) {
        for (std::size_t i = 0; i < c.index.size(); ++i) {
            if (c.index[i] == removed) {
                c.index.erase(c.index.begin() + static_cast<std::ptrdiff_t>(i));
                break;
            }
        }
    }
    // The slot stays behind, unreachable; it is never handed out again.
}

template <class V>
void tree_clear(Collection<V>& c) {
    c.count = 0;
    c.index.clear();
    c.nodes.clear();
    c.root = kNone;
}

// Random path selection: one draw per visited node, its lowest bit choosing
// right (1) or left (0), until a null link; then, when more than one node was
// visited, one more draw picks the node at depth k + 1 of the walked path.
template <class V>
std::optional<V> random_path(const Collection<V>& c, Draws& draws) {
    if (c.root == kNone) {
        return std::nullopt;
    }
    std::vector<int> directions;
    int at = c.root;
    while (at != kNone) {
        const int d = draws.next() & 1;
        directions.push_back(d);
        at = d == 1 ? c.at(at).right : c.at(at).left;
    }
    const std::size_t n = directions.size();
    if (n == 1) {
        return c.at(c.root).value;
    }
    const int r2 = draws.next();
    const std::size_t k = static_cast<std::size_t>(r2 & 0x7FFF) % (n - 1);
    at = c.root;
    for (std::size_t step = 0; step <= k; ++step) {
        at = directions[step] == 1 ? c.at(at).right : c.at(at).left;
    }
    return c.at(at).value;
}

template <class V>
const Node<V>* index_entry(const Collection<V>& c, bool indexed, std::int32_t position) {
    if (!indexed || position < 0 || static_cast<std::size_t>(position) >= c.index.size()) {
        return nullptr;
    }
    return &c.at(c.index[static_cast<std::size_t>(position)]);
}

// The index scanned from position 0 for the first value that matches.
template <class V, class Match>
std::int32_t index_scan(const Collection<V>& c, bool indexed, Match match) {
    for (std::size_t i = 0; indexed && i < c.index.size(); ++i) {
        if (match(c.at(c.index[i]).value)) {
            return static_cast<std::int32_t>(i);
        }
    }
    return -1;
}

template <class V>
std::size_t tree_height(const Collection<V>& c) {
    std::size_t highest = 0;
    std::vector<std::pair<int, std::size_t>> pending;
    if (c.root != kNone) {
        pending.emplace_back(c.root, 1);
    }
    while (!pending.empty()) {
        const auto [at, depth] = pending.back();
        pending.pop_back();
        highest = depth > highest ? depth : highest;
        if (c.at(at).left != kNone) {
            pending.emplace_back(c.at(at).left, depth + 1);
        }
        if (c.at(at).right != kNone) {
            pending.emplace_back(c.at(at).right, depth + 1);
        }
    }
    return highest;
}

}  // namespace

int Draws::next() {
    if (used_ >= values_.size()) {
        model_bug("more draws were needed than were scripted");
    }
    return values_[used_++];
}

int compare_integers(std::int32_t a, std::int32_t b) {
    if (a < b) {
        return -1;
    }
    return a > b ? 1 : 0;
}

int compare_floats(float a, float b) {
    if (a < b) {
        return -1;
    }
    return a > b ? 1 : 0;
}

int compare_strings(const std::string& a, const std::string& b, bool case_sensitive) {
    std::size_t i = 0;
    for (;;) {
        unsigned x = i < a.size() ? static_cast<unsigned char>(a[i]) : 0U;
        unsigned y = i < b.size() ? static_cast<unsigned char>(b[i]) : 0U;
        if (!case_sensitive) {
            if (x >= 'A' && x <= 'Z') {
                x = x - 'A' + 'a';
            }
            if (y >= 'A' && y <= 'Z') {
                y = y - 'A' + 'a';
            }
        }
        if (x != y) {
            return x < y ? -1 : 1;
        }
        if (x == 0) {
            return 0;
        }
        ++i;
    }
}

Instance::Instance(std::int32_t case_word, std::int32_t index_word) : case_word_(case_word), index_word_(index_word) {}

bool Instance::contains_integer(std::int32_t v) const {
    return tree_contains(integers_, v, compare_integers);
}

bool Instance::contains_float(float v) const {
    if (v != v) {  // a NaN is never held
        return false;
    }
    return tree_contains(floats_, v, compare_floats);
}

bool Instance::contains_string(const Text& v) const {
    const auto s = c_string(v);
    if (!s) {
        return false;
    }
    return tree_contains(strings_, *s, string_order());
}

void Instance::add_integer(std::int32_t v) {
    tree_add(integers_, v, indexed(), compare_integers);
}
void Instance::remove_integer(std::int32_t v) {
    tree_remove(integers_, v, indexed(), compare_integers);
}
void Instance::add_float(float v) {
    if (v != v) {
        return;
    }
    tree_add(floats_, v, indexed(), compare_floats);
}

void Instance::remove_float(float v) {
    if (v != v) {
        return;
    }
    tree_remove(floats_, v, indexed(), compare_floats);
}

void Instance::add_string(const Text& v) {
    const auto s = c_string(v);
    if (!s) {
        return;
    }
    tree_add(strings_, *s, indexed(), string_order());
}

void Instance::remove_string(const Text& v) {
    const auto s = c_string(v);
    if (!s) {
        return;
    }
    tree_remove(strings_, *s, indexed(), string_order());
}

void Instance::clear(sorvel::simulated::Set set) {
    using enum sorvel::simulated::Set;
    set == integers ? tree_clear(integers_) : set == floats ? tree_clear(floats_) : tree_clear(strings_);
}

void Instance::load(const std::optional<std::string>& file, std::int32_t balance, Draws& draws,
                    std::optional<std::size_t> left_out) {
    if (!file) {
        return;
    }
    std::vector<std::string> lines = split_lines(*file);
    std::size_t adds = 0;
    const auto add_line = [&](const std::string& line) {
        if (adds++ != left_out) {
            add_string(line);
        }
    };
    if (balance == 0) {
        for (const std::string& line : lines) {
            add_line(line);
        }
        return;
    }
    // The lines not yet added, in file order: a list whose gap closes. It
    // holds line numbers, so that closing the gap moves no strings.
    std::vector<std::size_t> left(lines.size());
    for (std::size_t i = 0; i < left.size(); ++i) {
        left[i] = i;
    }
    while (!left.empty()) {
        const std::size_t k = static_cast<std::size_t>(draws.next() & 0x7FFF) % left.size();
        const std::size_t line = left[k];
        left.erase(left.begin() + static_cast<std::ptrdiff_t>(k));
        add_line(lines[line]);
    }
}

std::int32_t Instance::integers_random(Draws& draws) const {
    return random_path(integers_, draws).value_or(0);
}

float Instance::floats_random(Draws& draws) const {
    return random_path(floats_, draws).value_or(0.0F);
}

std::string Instance::strings_random(Draws& draws) const {
    return random_path(strings_, draws).value_or(std::string());
}

std::int32_t Instance::index_of_integer(std::int32_t v) const {
    return index_scan(integers_, indexed(), [v](std::int32_t held) { return held == v; });
}

std::int32_t Instance::integer_at(std::int32_t position) const {
    const Node<std::int32_t>* node = index_entry(integers_, indexed(), position);
    return node == nullptr ? 0 : node->value;
}

std::int32_t Instance::index_of_float(float v) const {
    // IEEE equality: never true for a NaN, and -0.0 finds +0.0.
    return index_scan(floats_, indexed(), [v](float held) { return held == v; });
}

float Instance::float_at(std::int32_t position) const {
    const Node<float>* node = index_entry(floats_, indexed(), position);
    return node == nullptr ? 0.0F : node->value;
}

std::int32_t Instance::index_of_string(const Text& v) const {
    const auto s = c_string(v);
    const bool cs = case_sensitive();
    return s ? index_scan(strings_, indexed(),
                          [&](const std::string& held) { return compare_strings(held, *s, cs) == 0; })
             : -1;
}

std::string Instance::string_at(std::int32_t position) const {
    const Node<std::string>* node = index_entry(strings_, indexed(), position);
    return node == nullptr ? std::string() : node->value;
}

std::size_t Instance::height(sorvel::simulated::Set set) const {
    using enum sorvel::simulated::Set;
    return set == integers ? tree_height(integers_) : set == floats ? tree_height(floats_) : tree_height(strings_);
}

std::vector<std::string> split_lines(const std::string& bytes) {
    std::vector<std::string> lines;
    std::string pending;
    for (const char byte : bytes) {
        if (byte == '\n' || byte == '\r') {
            if (!pending.empty()) {
                lines.push_back(pending);
                pending.clear();
            }
        } else {
            pending.push_back(byte);
        }
    }
    if (!pending.empty()) {
        lines.push_back(pending);
    }
    return lines;
}

}  // namespace sorvel::test::model
