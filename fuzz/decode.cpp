#include "decode.hpp"

#include <algorithm>
#include <array>
#include <bit>
#include <utility>

namespace fuzzdriver {
namespace {

// Option words: every on/off combination, and values other than 0 and 1.
constexpr std::array<std::int32_t, 4> kOptionWords = {-1, 0, 1, 2};
constexpr std::size_t kMaxSweeps = 2;  // per input, besides the final one

}  // namespace

std::int32_t count_of(const sorvel::test::model::Instance& m, Set set) {
    switch (set) {
        case Set::integers: return m.integers_size();
        case Set::floats: return m.floats_size();
        case Set::strings: return m.strings_size();
    }
    return 0;
}

Options Decoder::options() {
    const std::uint8_t options = in_.byte();
    Options o;
    o.case_word = kOptionWords[options & 3];
    o.index_word = kOptionWords[(options >> 2) & 3];
    o.creation8 = static_cast<std::int32_t>(static_cast<std::int16_t>(in_.u16()));
    o.creation12 = static_cast<std::int32_t>(static_cast<std::uint32_t>(options) * 0x91000193U);
    return o;
}

bool Decoder::next(const std::vector<const sorvel::test::model::Instance*>& models, Event& out) {
    out.integer.reset();
    out.bits.reset();
    out.text.reset();
    out.param_word = 0;
    out.draws.clear();
    out.failing = -1;
    out.file = Event::File::none;
    out.contents.clear();
    out.lines = 0;
    out.balance = 0;
    while (walk_.steps > 0) {
        if (walk_step(*models[walk_.instance], out)) {
            return true;
        }
    }
    if (events_ == kMaxEvents || in_.exhausted()) {
        return false;
    }
    out.ordinal = events_++;
    const std::uint8_t op = in_.byte();
    out.instance = (op >> 5) % models.size();
    const sorvel::test::model::Instance& m = *models[out.instance];
    const unsigned kind = op & 31U;
    if (kind < 3) {
        out.number = kind;
        condition(out);
    } else if (kind < 13) {
        action(out, kind - 3, -1);
    } else if (kind < 25) {
        expression(out, m, kind - 13);
    } else if (kind == 25 && sweeps_ < kMaxSweeps) {
        ++sweeps_;
        out.kind = Event::Kind::sweep;
    } else if (kind == 26) {
        out.kind = Event::Kind::recreate;
        out.options = options();
    } else if (kind == 27) {
        const std::uint8_t head = in_.byte();
        walk_.instance = out.instance;
        walk_.set = static_cast<Set>(head % 3);
        walk_.position =
            static_cast<std::int32_t>(in_.byte() % (static_cast<unsigned>(count_of(m, walk_.set)) + 2U)) - 1;
        walk_.last.reset();
        walk_.removed.reset();
        walk_.steps = 3 + (head >> 2) % 14;
        return next(models, out);
    } else if (kind == 25) {
        out.kind = Event::Kind::compare;
    } else if (kind < 31) {
        static constexpr std::array<std::size_t, 3> kAdds = {0, 6, 3};
        action(out, kAdds[kind - 28], -1);
    } else {
        const std::uint8_t b = in_.byte();
        if (b % 4 == 3) {
            // Half the time one of the first three allocations: the file
            // buffer, the balanced bookkeeping, the first line's node.
            action(out, 9, (b & 4) != 0 ? (b >> 3) % 3 : (b >> 3) % 32);
        } else {
            static constexpr std::array<std::size_t, 3> kAdds = {0, 3, 6};
            action(out, kAdds[b % 4], (b >> 2) % 3);
        }
    }
    return true;
}

void Decoder::condition(Event& out) {
    out.kind = Event::Kind::condition;
    switch (out.number) {
        case 0: out.integer = values_.integer(); break;
        case 1: out.bits = values_.float_bits(); break;
        default: out.text = values_.text(); break;
    }
}

void Decoder::action(Event& out, std::size_t number, long failing) {
    out.kind = Event::Kind::action;
    out.number = number;
    out.failing = failing;
    switch (number) {
        case 0:
        case 1: out.integer = values_.integer(); break;
        case 3:
        case 4: out.bits = values_.float_bits(); break;
        case 6:
        case 7: out.text = values_.text(); break;
        case 9: {
            const std::uint8_t which = in_.byte() % 8;
            out.file = which < 6 ? Event::File::written : which == 6 ? Event::File::missing : Event::File::none;
            if (out.file == Event::File::written) {
                out.contents = values_.file();
                out.lines = sorvel::test::model::split_lines(out.contents).size();
            }
            out.balance = values_.balance();
            out.draws = values_.draws(out.balance != 0 ? out.lines : 0);
            break;
        }
        default: break;  // the clears
    }
}

void Decoder::expression(Event& out, const sorvel::test::model::Instance& m, std::size_t number) {
    out.kind = Event::Kind::expression;
    out.number = number;
    out.param_word = values_.param_word();
    switch (number) {
        case 1: out.draws = values_.draws(m.height(Set::integers) + 1); break;
        case 3: out.draws = values_.draws(m.height(Set::floats) + 1); break;
        case 5: out.draws = values_.draws(m.height(Set::strings) + 1); break;
        case 6: out.integer = values_.integer(); break;
        case 8: out.bits = values_.float_bits(); break;
        case 10: out.text = values_.text(); break;
        case 7:
        case 9:
        case 11: {
            const auto set = static_cast<Set>((number - 7) / 2);
            out.integer = values_.position(count_of(m, set));
            remember_read(m, set, *out.integer);
            break;
        }
        default: break;  // the sizes
    }
}

std::optional<Decoder::Held> Decoder::held_at(const sorvel::test::model::Instance& m, Set set, std::int32_t p) {
    if (p < 0 || p >= count_of(m, set)) {
        return std::nullopt;
    }
    Held v;
    switch (set) {
        case Set::integers: v.integer = m.integer_at(p); break;
        case Set::floats: v.bits = std::bit_cast<std::uint32_t>(m.float_at(p)); break;
        case Set::strings: v.text = m.string_at(p); break;
    }
    return v;
}

// The read of a walk: ElementAt, with the position as the parameter word.
void Decoder::read(const sorvel::test::model::Instance& m, Event& out, std::int32_t position) {
    out.kind = Event::Kind::expression;
    out.number = 7 + 2 * static_cast<std::size_t>(walk_.set);
    out.integer = position;
    out.param_word = position;
    if (std::optional<Held> v = remember_read(m, walk_.set, position)) {
        walk_.last = std::move(v);
    }
}

// What a read by position gives joins the values later events pick, and
// later positions gather around it.
std::optional<Decoder::Held> Decoder::remember_read(const sorvel::test::model::Instance& m, Set set,
                                                    std::int32_t position) {
    std::optional<Held> v = held_at(m, set, position);
    if (v) {
        values_.read_at(position);
        if (set == Set::integers) {
            values_.met(v->integer);
        } else if (set == Set::floats) {
            values_.met(std::bit_cast<float>(v->bits));
        } else {
            values_.met(*v->text);
        }
    }
    return v;
}

void Decoder::with_value(Event& out, const Held& v) const {
    switch (walk_.set) {
        case Set::integers: out.integer = v.integer; break;
        case Set::floats: out.bits = v.bits; break;
        case Set::strings: out.text = v.text; break;
    }
}

// One step of a walk; false when the step has nothing to do.
bool Decoder::walk_step(const sorvel::test::model::Instance& m, Event& out) {
    --walk_.steps;
    const Set set = walk_.set;
    const auto c_number = static_cast<std::size_t>(set);
    std::int32_t& p = walk_.position;
    p = std::clamp(p, std::int32_t{-1}, count_of(m, set));
    out.instance = walk_.instance;
    const std::uint8_t op = in_.byte();
    switch (op % 8) {
        case 0:
        case 1:
        case 2:  // onwards
            read(m, out, p++);
            return true;
        case 3:  // back, or around
            p += (op >> 3) % 5 - 2;
            read(m, out, p);
            return true;
        case 4:
            if (!walk_.last && !walk_.removed) {
                return false;
            }
            out.kind = Event::Kind::expression;
            out.number = 6 + 2 * c_number;
            with_value(out, walk_.last && (op & 8) == 0 ? *walk_.last : walk_.removed ? *walk_.removed : *walk_.last);
            return true;
        case 5:  // the value just read
            if (!walk_.last) {
                return false;
            }
            out.kind = Event::Kind::action;
            out.number = 3 * c_number + 1;
            with_value(out, *walk_.last);
            walk_.removed = std::move(walk_.last);
            walk_.last.reset();
            p -= (op >> 3) & 1;
            return true;
        case 6:  // back in, at the end; or a duplicate
            if (!walk_.removed && !walk_.last) {
                return false;
            }
            out.kind = Event::Kind::action;
            out.number = 3 * c_number;
            out.failing = (op >> 3) % 4 == 3 ? (op >> 5) % 3 : -1;
            with_value(out, walk_.removed ? *walk_.removed : *walk_.last);
            return true;
        default:  // unread: the value at the position, or one the walk has passed
            if (std::optional<Held> v = held_at(m, set, p - (op >> 3) % 4)) {
                out.kind = Event::Kind::action;
                out.number = 3 * c_number + 1;
                with_value(out, *v);
                walk_.removed = std::move(v);
                return true;
            }
            return false;
    }
}

}  // namespace fuzzdriver
