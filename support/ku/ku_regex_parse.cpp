// SPDX-License-Identifier: MIT
// ku_regex_parse: reads a POSIX extended regular expression into a tree.
//
// What POSIX leaves undefined (a repeat with nothing to repeat, a backslash before a letter or digit, back-references)
// is refused, but for empty alternatives, which match the empty text. Classes such as [:alpha:] are those of ASCII.
// Recursion goes as deep as parentheses are nested, which is bounded.
#include "ku_regex.h"
#include "ku_utf8.h"

#include <cstring>

namespace
{

constexpr uint32_t highest_character = 0x10FFFF;

struct class_name {
    char             name[8];
    ku_regex_range_t ranges[4]; // those behind the last one have last 0
};

constexpr class_name class_names[] = {{"alnum", {{'0', '9'}, {'A', 'Z'}, {'a', 'z'}}},
                                      {"alpha", {{'A', 'Z'}, {'a', 'z'}}},
                                      {"blank", {{' ', ' '}, {'\t', '\t'}}},
                                      {"cntrl", {{1, 31}, {127, 127}}},
                                      {"digit", {{'0', '9'}}},
                                      {"graph", {{33, 126}}},
                                      {"lower", {{'a', 'z'}}},
                                      {"print", {{32, 126}}},
                                      {"punct", {{33, 47}, {58, 64}, {91, 96}, {123, 126}}},
                                      {"space", {{' ', ' '}, {'\t', '\r'}}},
                                      {"upper", {{'A', 'Z'}}},
                                      {"xdigit", {{'0', '9'}, {'A', 'F'}, {'a', 'f'}}}};

class reader
{
  public:
    reader(const uint8_t * p, size_t length, const char * p_source, ku_regex_tree_t * p_tree,
           ku_expr_trouble_t * p_trouble)
        : p_(p), p_end_(p + length), p_source_(p_source), tree_(*p_tree), p_trouble_(p_trouble)
    {
    }

    [[nodiscard]] kt_int32_t read()
    {
        if (const kt_int32_t rc = read_choice(&tree_.root); rc != 0)
            return rc;
        return p_ < p_end_ ? refuse("a ) that closes nothing") : 0;
    }

  private:
    [[nodiscard]] kt_int32_t refuse(const char * p_reason)
    {
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_SYNTAX, p_source_, "wrong regular expression: %s", p_reason);
    }
    [[nodiscard]] kt_int32_t refuse_size()
    {
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TOO_LONG, p_source_, "the regular expression is too large");
    }
    [[nodiscard]] kt_int32_t refuse_memory()
    {
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_NO_MEMORY, p_source_, "there is no memory");
    }

    bool is_at(uint8_t c) const { return p_ < p_end_ && *p_ == c; }

    [[nodiscard]] kt_int32_t add_node(const ku_regex_node_t & node, uint32_t * p_index)
    {
        if (tree_.nodes.count() >= ku_regex_most_nodes)
            return refuse_size();
        *p_index = static_cast<uint32_t>(tree_.nodes.count());
        return tree_.nodes.push(node) ? 0 : refuse_memory();
    }

    // Adds the node behind the last child of its parent.
    void append(uint32_t parent, uint32_t child)
    {
        tree_.nodes[child].previous    = tree_.nodes[parent].last_child;
        tree_.nodes[parent].last_child = child;
    }

    static ku_regex_node_t node_of(ku_regex_node_kind_t kind)
    {
        return {kind, 0, 0, ku_regex_none, ku_regex_none, ku_regex_none};
    }

    [[nodiscard]] kt_int32_t read_choice(uint32_t * p_index)
    {
        if (++depth_ > ku_regex_deepest_nesting)
            return refuse_size();
        if (const kt_int32_t rc = add_node(node_of(KU_REGEX_CHOICE), p_index); rc != 0)
            return rc;
        for (;;) {
            uint32_t branch = 0;
            if (const kt_int32_t rc = read_sequence(&branch); rc != 0)
                return rc;
            append(*p_index, branch);
            if (!is_at('|'))
                break;
            p_++;
        }
        depth_--;
        return 0;
    }

    [[nodiscard]] kt_int32_t read_sequence(uint32_t * p_index)
    {
        if (const kt_int32_t rc = add_node(node_of(KU_REGEX_SEQUENCE), p_index); rc != 0)
            return rc;
        while (p_ < p_end_ && *p_ != '|' && *p_ != ')') {
            uint32_t piece = 0;
            if (const kt_int32_t rc = read_atom(&piece); rc != 0)
                return rc;
            if (const kt_int32_t rc = read_repeats(&piece); rc != 0)
                return rc;
            append(*p_index, piece);
        }
        return 0;
    }

    [[nodiscard]] kt_int32_t read_atom(uint32_t * p_index)
    {
        switch (*p_) {
        case '(':
            return read_group(p_index);
        case '[':
            return read_bracket(p_index);
        case '^':
            p_++;
            return add_node(node_of(KU_REGEX_START), p_index);
        case '$':
            p_++;
            return add_node(node_of(KU_REGEX_END), p_index);
        case '.':
            p_++;
            return add_set({0, highest_character}, p_index);
        case '*':
        case '+':
        case '?':
        case '{':
            return refuse("a repeat with nothing to repeat");
        case '\\':
            p_++;
            if (p_ >= p_end_)
                return refuse("a backslash at the end");
            if (*p_ >= 0x80 || *p_ <= ' ' || std::memchr(".[\\()*+?{}|^$]-/,:;=<>!\"#%&'@_`~", *p_, 32) == nullptr)
                return refuse("a backslash before a character that has no special meaning");
            break;
        default:
            break;
        }
        uint32_t character = 0;
        if (const kt_int32_t rc = read_character(&character); rc != 0)
            return rc;
        return add_set({character, character}, p_index);
    }

    // The text that the expression stands in is UTF-8, but escapes can make bytes that aren't.
    [[nodiscard]] kt_int32_t read_character(uint32_t * p_character)
    {
        const size_t length = ku_utf8_read(p_, p_end_, p_character);
        if (length == 0)
            return refuse("a byte that is no character");
        p_ += length;
        return 0;
    }

    [[nodiscard]] kt_int32_t read_group(uint32_t * p_index)
    {
        p_++;
        if (const kt_int32_t rc = read_choice(p_index); rc != 0)
            return rc;
        if (!is_at(')'))
            return refuse("a ( that is never closed");
        p_++;
        return 0;
    }

    // ---- Repeats ----

    [[nodiscard]] kt_int32_t read_repeats(uint32_t * p_index)
    {
        for (unsigned stacked = 0;; stacked++) {
            uint16_t minimum = 0, maximum = ku_regex_no_limit;
            if (is_at('*') || is_at('+') || is_at('?')) {
                minimum = *p_ == '+' ? 1 : 0;
                maximum = *p_ == '?' ? 1 : ku_regex_no_limit;
                p_++;
            } else if (is_at('{')) {
                if (const kt_int32_t rc = read_interval(&minimum, &maximum); rc != 0)
                    return rc;
            } else {
                return 0;
            }
            const ku_regex_node_kind_t kind = tree_.nodes[*p_index].kind;
            if (kind == KU_REGEX_START || kind == KU_REGEX_END)
                return refuse("a repeat with nothing to repeat");
            if (depth_ + stacked > ku_regex_deepest_nesting)
                return refuse_size();
            ku_regex_node_t repeat = node_of(KU_REGEX_REPEAT);
            repeat.minimum         = minimum;
            repeat.maximum         = maximum;
            uint32_t index         = 0;
            if (const kt_int32_t rc = add_node(repeat, &index); rc != 0)
                return rc;
            append(index, *p_index);
            *p_index = index;
        }
    }

    bool read_count(uint16_t * p_count)
    {
        unsigned count = 0;
        bool     any   = false;
        for (; p_ < p_end_ && *p_ >= '0' && *p_ <= '9' && count <= ku_regex_most_repeats; p_++, any = true)
            count = count * 10 + (*p_ - '0');
        *p_count = static_cast<uint16_t>(count);
        return any && count <= ku_regex_most_repeats;
    }

    [[nodiscard]] kt_int32_t read_interval(uint16_t * p_minimum, uint16_t * p_maximum)
    {
        constexpr const char * p_form = "a repeat must be {m}, {m,} or {m,n} with m <= n <= 255";
        p_++;
        if (!read_count(p_minimum))
            return refuse(p_form);
        *p_maximum = *p_minimum;
        if (is_at(',')) {
            p_++;
            *p_maximum = ku_regex_no_limit;
            if (!is_at('}') && (!read_count(p_maximum) || *p_maximum < *p_minimum))
                return refuse(p_form);
        }
        if (!is_at('}'))
            return refuse(p_form);
        p_++;
        return 0;
    }

    // ---- Sets ----

    [[nodiscard]] kt_int32_t add_range(const ku_regex_range_t & range)
    {
        if (tree_.ranges.count() >= ku_regex_most_ranges)
            return refuse_size();
        return tree_.ranges.push(range) ? 0 : refuse_memory();
    }

    [[nodiscard]] kt_int32_t finish_set(ku_regex_set_t set, uint32_t * p_index)
    {
        set.range_count      = static_cast<uint32_t>(tree_.ranges.count()) - set.first_range;
        ku_regex_node_t node = node_of(KU_REGEX_SET);
        node.set             = static_cast<uint32_t>(tree_.sets.count());
        if (!tree_.sets.push(set))
            return refuse_memory();
        return add_node(node, p_index);
    }

    [[nodiscard]] kt_int32_t add_set(const ku_regex_range_t & range, uint32_t * p_index)
    {
        const ku_regex_set_t set{static_cast<uint32_t>(tree_.ranges.count()), 0, false};
        if (const kt_int32_t rc = add_range(range); rc != 0)
            return rc;
        return finish_set(set, p_index);
    }

    [[nodiscard]] kt_int32_t read_bracket(uint32_t * p_index)
    {
        constexpr const char * p_unclosed = "a [ that is never closed";
        ku_regex_set_t         set{static_cast<uint32_t>(tree_.ranges.count()), 0, false};
        p_++;
        if (is_at('^')) {
            set.inverted = true;
            p_++;
        }
        for (bool first = true; first || !is_at(']'); first = false) {
            if (p_ >= p_end_)
                return refuse(p_unclosed);
            if (*p_ == '[' && p_ + 1 < p_end_ && p_[1] == ':') {
                if (const kt_int32_t rc = read_class_name(); rc != 0)
                    return rc;
                continue;
            }
            ku_regex_range_t range = {0, 0};
            if (const kt_int32_t rc = read_element(&range.first); rc != 0)
                return rc;
            range.last = range.first;
            if (is_at('-') && p_ + 1 < p_end_ && p_[1] != ']') {
                p_++;
                if (const kt_int32_t rc = read_element(&range.last); rc != 0)
                    return rc;
                if (range.last < range.first)
                    return refuse("a range that ends before it starts");
            }
            if (const kt_int32_t rc = add_range(range); rc != 0)
                return rc;
        }
        p_++;
        return finish_set(set, p_index);
    }

    // One character, or [.c.] or [=c=] with one character.
    [[nodiscard]] kt_int32_t read_element(uint32_t * p_character)
    {
        if (p_ >= p_end_)
            return refuse("a [ that is never closed");
        const uint8_t mark = *p_ == '[' && p_ + 1 < p_end_ ? p_[1] : 0;
        if (mark != '.' && mark != '=')
            return read_character(p_character);
        p_ += 2;
        if (p_ < p_end_) {
            if (const kt_int32_t rc = read_character(p_character); rc != 0)
                return rc;
        }
        if (!is_at(mark) || p_ + 1 >= p_end_ || p_[1] != ']')
            return refuse("[. .] and [= =] take one character");
        p_ += 2;
        return 0;
    }

    [[nodiscard]] kt_int32_t read_class_name()
    {
        p_ += 2;
        for (const class_name & candidate : class_names) {
            const size_t length = std::strlen(candidate.name);
            if (static_cast<size_t>(p_end_ - p_) < length + 2 || std::memcmp(p_, candidate.name, length) != 0 ||
                p_[length] != ':' || p_[length + 1] != ']')
                continue;
            p_ += length + 2;
            for (const ku_regex_range_t & range : candidate.ranges) {
                if (range.last == 0)
                    break;
                if (const kt_int32_t rc = add_range(range); rc != 0)
                    return rc;
            }
            return 0;
        }
        return refuse("no such class of characters");
    }

    const uint8_t *       p_;
    const uint8_t * const p_end_;
    const char * const    p_source_;
    ku_regex_tree_t &     tree_;
    ku_expr_trouble_t *   p_trouble_;
    unsigned              depth_ = 0;
};

} // namespace

kt_int32_t ku_regex_parse(const uint8_t * p, size_t length, const char * p_source, ku_regex_tree_t * p_tree,
                          ku_expr_trouble_t * p_trouble)
{
    return reader(p, length, p_source, p_tree, p_trouble).read();
}
