// SPDX-License-Identifier: MIT
// ku_regex_build: makes a regular expression's tree into a program.
//
// First the alphabet: the characters fall into runs at the borders of all ranges, and runs that are in the same sets
// make one class. Then the nondeterministic automaton, from its end to its start, so that each piece knows what follows
// it. Then, as long as it stays small, the table of the deterministic one. All in scratch arrays, and at last into one
// block.
// Failure: refused when a limit is passed; the only other one is memory.
#include "ku_regex.h"

#include <algorithm>
#include <cstring>
#include <utility>

namespace
{

constexpr uint32_t beyond_characters  = 0x110000;
constexpr uint32_t first_beyond_ascii = 0x80;
constexpr size_t   least_work         = 4096; // for clearing the scratch memory and for the program's head
constexpr size_t   node_work          = 64;   // for making an instruction, or finding that there is none to make

class builder
{
  public:
    builder(const ku_regex_tree_t & tree, const char * p_source, uint32_t * p_work, ku_expr_trouble_t * p_trouble)
        : tree_(tree), p_source_(p_source), work_(*p_work), p_trouble_(p_trouble)
    {
    }

    [[nodiscard]] kt_int32_t build()
    {
        if (!spend(least_work))
            return refuse_size();
        if (const kt_int32_t rc = make_alphabet(); rc != 0)
            return rc;
        if (const kt_int32_t rc = make_sets(); rc != 0)
            return rc;
        if (const kt_int32_t rc = make_automaton(); rc != 0)
            return rc;
        return make_table();
    }

    [[nodiscard]] kt_int32_t lay_out(ku_growable<uint8_t> * p_bytes, kt_uint32_t * p_offset);

  private:
    [[nodiscard]] kt_int32_t refuse_size()
    {
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TOO_LONG, p_source_, "the regular expression is too large");
    }
    [[nodiscard]] kt_int32_t refuse_memory()
    {
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_NO_MEMORY, p_source_, "there is no memory");
    }

    // False: the budget is used up.
    [[nodiscard]] bool spend(size_t steps)
    {
        if (steps >= work_) {
            work_ = 0;
            return false;
        }
        work_ -= static_cast<uint32_t>(steps);
        return true;
    }

    // ---- The alphabet ----

    [[nodiscard]] kt_int32_t make_alphabet()
    {
        uint32_t * p_borders = borders_.add(2 * tree_.ranges.count() + 2);
        if (p_borders == nullptr)
            return refuse_memory();
        *p_borders++ = 0;
        *p_borders++ = first_beyond_ascii; // so that no class of the binary search is one of ASCII
        for (size_t i = 0; i < tree_.ranges.count(); i++) {
            *p_borders++ = tree_.ranges[i].first;
            *p_borders++ = tree_.ranges[i].last + 1;
        }
        std::sort(borders_.data(), borders_.data() + borders_.count());
        const uint32_t * p_end = std::unique(borders_.data(), borders_.data() + borders_.count());
        size_t           count = static_cast<size_t>(p_end - borders_.data());
        while (borders_[count - 1] >= beyond_characters)
            count--;
        borders_.truncate(count);

        uint16_t * p_classes = run_classes_.add(count);
        if (p_classes == nullptr)
            return refuse_memory();
        for (size_t i = 0; i < count; i++)
            p_classes[i] = static_cast<uint16_t>(i);
        return 0;
    }

    bool set_has(const ku_regex_set_t & set, uint32_t character) const
    {
        bool found = false;
        for (uint32_t i = 0; i < set.range_count && !found; i++) {
            const ku_regex_range_t & range = tree_.ranges[set.first_range + i];
            found                          = character >= range.first && character <= range.last;
        }
        return found != set.inverted;
    }

    // Bits by set and run, and then the runs with equal columns become one class.
    [[nodiscard]] kt_int32_t make_sets()
    {
        const size_t         runs = borders_.count(), sets = tree_.sets.count();
        const size_t         column_bytes = sets / 8 + 1;
        ku_growable<uint8_t> columns;
        uint8_t *            p_columns = columns.add(runs * column_bytes);
        if (p_columns == nullptr)
            return refuse_memory();
        std::memset(p_columns, 0, runs * column_bytes);
        for (size_t s = 0; s < sets; s++) {
            if (!spend(runs * (tree_.sets[s].range_count + 1)))
                return refuse_size();
            for (size_t r = 0; r < runs; r++) {
                if (set_has(tree_.sets[s], borders_[r]))
                    p_columns[r * column_bytes + s / 8] |= static_cast<uint8_t>(1u << s % 8);
            }
        }
        if (const kt_int32_t rc = merge_runs(p_columns, column_bytes); rc != 0)
            return rc;

        set_bytes_       = class_count_ / 8u + 1u;
        uint8_t * p_bits = set_bits_.add(sets * set_bytes_ + 1);
        if (p_bits == nullptr)
            return refuse_memory();
        std::memset(p_bits, 0, sets * set_bytes_ + 1);
        for (size_t s = 0; s < sets; s++) {
            for (size_t r = 0; r < runs; r++) {
                if ((p_columns[r * column_bytes + s / 8] >> s % 8 & 1) != 0)
                    p_bits[s * set_bytes_ + run_classes_[r] / 8u] |= static_cast<uint8_t>(1u << run_classes_[r] % 8);
            }
        }
        return 0;
    }

    // Sorts the runs by their columns, and counts up where they differ. The class behind the last one is that of bytes
    // that are no character; no set has it.
    [[nodiscard]] kt_int32_t merge_runs(const uint8_t * p_columns, size_t column_bytes)
    {
        const size_t runs = borders_.count();
        if (!spend(runs * column_bytes * 16))
            return refuse_size();
        ku_growable<uint16_t> order;
        uint16_t *            p_order = order.add(runs);
        if (p_order == nullptr)
            return refuse_memory();
        for (size_t r = 0; r < runs; r++)
            p_order[r] = static_cast<uint16_t>(r);
        const auto compare = [&](uint16_t a, uint16_t b) {
            return std::memcmp(p_columns + a * column_bytes, p_columns + b * column_bytes, column_bytes);
        };
        std::sort(p_order, p_order + runs, [&](uint16_t a, uint16_t b) { return compare(a, b) < 0; });
        class_count_ = 0;
        for (size_t i = 0; i < runs; i++) {
            if (i != 0 && compare(p_order[i - 1], p_order[i]) != 0)
                class_count_++;
            run_classes_[p_order[i]] = class_count_;
        }
        class_count_ = static_cast<uint16_t>(class_count_ + 2);
        return 0;
    }

    // ---- The nondeterministic automaton ----

    [[nodiscard]] kt_int32_t add(const ku_regex_instruction_t & instruction, uint16_t * p_index)
    {
        if (instructions_.count() >= ku_regex_most_instructions)
            return refuse_size();
        *p_index = static_cast<uint16_t>(instructions_.count());
        return instructions_.push(instruction) ? 0 : refuse_memory();
    }

    [[nodiscard]] kt_int32_t make_automaton()
    {
        uint16_t match = 0;
        if (const kt_int32_t rc = add({KU_REGEX_OP_MATCH, 0, 0}, &match); rc != 0)
            return rc;
        return make_node(tree_.root, match, &start_);
    }

    // *p_next: what follows; becomes where the node's own part starts.
    [[nodiscard]] kt_int32_t prepend(uint32_t node, uint16_t * p_next) { return make_node(node, *p_next, p_next); }

    [[nodiscard]] kt_int32_t make_node(uint32_t index, uint16_t next, uint16_t * p_start)
    {
        if (!spend(node_work))
            return refuse_size();
        const ku_regex_node_t & node = tree_.nodes[index];
        switch (node.kind) {
        case KU_REGEX_NOTHING:
            break;
        case KU_REGEX_SET:
            return add({KU_REGEX_OP_SET, next, static_cast<uint16_t>(node.set)}, p_start);
        case KU_REGEX_START:
            return add({KU_REGEX_OP_START, next, 0}, p_start);
        case KU_REGEX_END:
            return add({KU_REGEX_OP_END, next, 0}, p_start);
        case KU_REGEX_SEQUENCE:
            *p_start = next;
            for (uint32_t child = node.last_child; child != ku_regex_none; child = tree_.nodes[child].previous) {
                if (const kt_int32_t rc = prepend(child, p_start); rc != 0)
                    return rc;
            }
            return 0;
        case KU_REGEX_CHOICE:
            return make_choice(node, next, p_start);
        case KU_REGEX_REPEAT:
            return node.maximum == ku_regex_no_limit ? make_loop(node, next, p_start)
                                                     : make_copies(node, next, p_start);
        }
        *p_start = next;
        return 0;
    }

    [[nodiscard]] kt_int32_t make_choice(const ku_regex_node_t & node, uint16_t next, uint16_t * p_start)
    {
        if (const kt_int32_t rc = make_node(node.last_child, next, p_start); rc != 0)
            return rc;
        for (uint32_t child = tree_.nodes[node.last_child].previous; child != ku_regex_none;
             child          = tree_.nodes[child].previous) {
            uint16_t branch = 0;
            if (const kt_int32_t rc = make_node(child, next, &branch); rc != 0)
                return rc;
            if (const kt_int32_t rc = add({KU_REGEX_OP_SPLIT, branch, *p_start}, p_start); rc != 0)
                return rc;
        }
        return 0;
    }

    // x{2,}: x and then a loop that x leads back into.
    [[nodiscard]] kt_int32_t make_loop(const ku_regex_node_t & node, uint16_t next, uint16_t * p_start)
    {
        uint16_t loop = 0, body = 0;
        if (const kt_int32_t rc = add({KU_REGEX_OP_SPLIT, 0, next}, &loop); rc != 0)
            return rc;
        if (const kt_int32_t rc = make_node(node.last_child, loop, &body); rc != 0)
            return rc;
        instructions_[loop].a = body;
        *p_start              = node.minimum == 0 ? loop : body;
        for (unsigned i = 1; i < node.minimum; i++) {
            if (const kt_int32_t rc = prepend(node.last_child, p_start); rc != 0)
                return rc;
        }
        return 0;
    }

    // x{2,4}: two that may be passed over behind two that may not.
    [[nodiscard]] kt_int32_t make_copies(const ku_regex_node_t & node, uint16_t next, uint16_t * p_start)
    {
        *p_start = next;
        for (unsigned i = node.minimum; i < node.maximum; i++) {
            if (const kt_int32_t rc = prepend(node.last_child, p_start); rc != 0)
                return rc;
            if (const kt_int32_t rc = add({KU_REGEX_OP_SPLIT, *p_start, next}, p_start); rc != 0)
                return rc;
        }
        for (unsigned i = 0; i < node.minimum; i++) {
            if (const kt_int32_t rc = prepend(node.last_child, p_start); rc != 0)
                return rc;
        }
        return 0;
    }

    // ---- The deterministic automaton ----

    // A state is the sorted list of its instructions, ended by no_instruction. State 0 is the start of the text; it is
    // never found again, since ^ holds there only.
    static constexpr uint16_t no_instruction = UINT16_MAX;

    [[nodiscard]] kt_int32_t make_table();
    [[nodiscard]] bool       add_state(unsigned where, uint16_t * p_state);
    [[nodiscard]] bool       same_members(uint32_t members_at) const;
    uint8_t                  flags_of_threads(unsigned where);
    void                     step(uint32_t members_at, uint16_t a_class);
    bool                     set_has_class(uint16_t set, uint16_t a_class) const
    {
        return (set_bits_[set * set_bytes_ + a_class / 8u] >> a_class % 8 & 1) != 0;
    }

    const ku_regex_tree_t & tree_;
    const char * const      p_source_;
    uint32_t &              work_;
    ku_expr_trouble_t *     p_trouble_;

    ku_growable<uint32_t>               borders_;
    ku_growable<uint16_t>               run_classes_;
    uint16_t                            class_count_ = 0;
    ku_growable<uint8_t>                set_bits_;
    size_t                              set_bytes_ = 0;
    ku_growable<ku_regex_instruction_t> instructions_;
    uint16_t                            start_ = 0;

    ku_growable<uint16_t> members_;       // of all states, one list behind the other
    ku_growable<uint32_t> state_members_; // where the list of each state starts
    ku_growable<uint8_t>  state_flags_;
    ku_growable<uint16_t> table_;
    ku_regex_threads_t    threads_; // the state under construction
    ku_regex_threads_t    beyond_;  // scratch
};

// The threads after a character of the class; the search may also start anew behind it.
void builder::step(uint32_t members_at, uint16_t a_class)
{
    threads_.clear();
    for (uint32_t i = members_at; members_[i] != no_instruction; i++) {
        const ku_regex_instruction_t & instruction = instructions_[members_[i]];
        if (instruction.operation == KU_REGEX_OP_SET && set_has_class(instruction.b, a_class))
            (void)ku_regex_follow(instructions_.data(), instruction.a, 0, &threads_);
    }
    (void)ku_regex_follow(instructions_.data(), start_, 0, &threads_);
    std::sort(threads_.members, threads_.members + threads_.count);
    for (uint16_t i = 0; i < threads_.count; i++)
        threads_.places[threads_.members[i]] = i;
}

uint8_t builder::flags_of_threads(unsigned where)
{
    uint8_t flags    = 0;
    bool    can_move = false;
    beyond_.clear();
    for (uint16_t i = 0; i < threads_.count; i++) {
        const ku_regex_instruction_t & instruction = instructions_[threads_.members[i]];
        if (instruction.operation == KU_REGEX_OP_MATCH)
            flags |= KU_REGEX_STATE_MATCHES | KU_REGEX_STATE_MATCHES_AT_END;
        if (instruction.operation == KU_REGEX_OP_SET || instruction.operation == KU_REGEX_OP_END)
            can_move = true;
        if (instruction.operation == KU_REGEX_OP_END &&
            ku_regex_follow(instructions_.data(), instruction.a, where | KU_REGEX_AT_END, &beyond_))
            flags |= KU_REGEX_STATE_MATCHES_AT_END;
    }
    // What could start anew later is among the threads already, so nothing will ever move.
    if (!can_move)
        flags |= KU_REGEX_STATE_IS_HOPELESS;
    return flags;
}

bool builder::same_members(uint32_t members_at) const
{
    for (uint16_t i = 0; i < threads_.count; i++) {
        if (members_[members_at + i] != threads_.members[i])
            return false; // also at the end of a shorter list
    }
    return members_[members_at + threads_.count] == no_instruction;
}

// Finds the state of the threads, or makes it. False: no memory.
bool builder::add_state(unsigned where, uint16_t * p_state)
{
    for (size_t s = 1; s < state_members_.count() && where == 0; s++) {
        if (same_members(state_members_[s])) {
            *p_state = static_cast<uint16_t>(s);
            return true;
        }
    }
    *p_state             = static_cast<uint16_t>(state_members_.count());
    const uint32_t first = static_cast<uint32_t>(members_.count());
    uint16_t *     p_new = members_.add(threads_.count + 1u);
    if (p_new == nullptr)
        return false;
    std::memcpy(p_new, threads_.members, threads_.count * sizeof(uint16_t));
    p_new[threads_.count] = no_instruction;
    return state_members_.push(first) && state_flags_.push(flags_of_threads(where)) &&
           table_.add(class_count_) != nullptr;
}

kt_int32_t builder::make_table()
{
    threads_.clear();
    std::memset(threads_.places, 0, sizeof threads_.places);
    std::memset(beyond_.places, 0, sizeof beyond_.places);
    (void)ku_regex_follow(instructions_.data(), start_, KU_REGEX_AT_START, &threads_);
    uint16_t state = 0;
    if (!add_state(KU_REGEX_AT_START, &state))
        return refuse_memory();
    size_t all_steps = 0;
    for (size_t s = 0; s < state_members_.count(); s++) {
        for (uint16_t c = 0; c < class_count_; c++) {
            step(state_members_[s], c);
            // Members looked at, and states compared.
            const size_t steps = 64 + threads_.count * 8u + state_members_.count();
            if (!add_state(0, &state))
                return refuse_memory();
            table_[s * class_count_ + c] = state;
            all_steps += steps;
            if (table_.count() > ku_regex_most_table_cells || all_steps > ku_regex_table_work || !spend(steps) ||
                work_ < ku_regex_work / 2) {
                state_members_.truncate(0); // too large: it stays nondeterministic
                return 0;
            }
        }
    }
    return 0;
}

kt_int32_t builder::lay_out(ku_growable<uint8_t> * p_bytes, kt_uint32_t * p_offset)
{
    ku_regex_program_t program = {};
    uint32_t           end     = sizeof program;
    const auto         place   = [&end](size_t bytes) {
        const uint32_t at = end;
        end               = static_cast<uint32_t>(end + (bytes + 3) / 4 * 4);
        return at;
    };
    const size_t states         = state_members_.count();
    program.class_count         = class_count_;
    program.boundary_count      = static_cast<uint16_t>(borders_.count());
    program.state_count         = static_cast<uint16_t>(states);
    program.instruction_count   = static_cast<uint16_t>(instructions_.count());
    program.start               = start_;
    program.set_bytes           = static_cast<uint16_t>(set_bytes_);
    program.boundaries_offset   = place(borders_.count() * sizeof(uint32_t));
    program.run_classes_offset  = place(run_classes_.count() * sizeof(uint16_t));
    program.table_offset        = place(states * class_count_ * sizeof(uint16_t));
    program.flags_offset        = place(states);
    const size_t instructions   = states != 0 ? 0 : instructions_.count(); // the table does without them
    const size_t set_bits       = states != 0 ? 0 : set_bits_.count();
    program.instructions_offset = place(instructions * sizeof(ku_regex_instruction_t));
    program.sets_offset         = place(set_bits);
    program.size                = end;
    for (size_t r = 0; r < borders_.count() && borders_[r] < first_beyond_ascii; r++) {
        const uint32_t last = r + 1 < borders_.count() ? borders_[r + 1] : beyond_characters;
        for (uint32_t c = borders_[r]; c < last && c < first_beyond_ascii; c++)
            program.ascii_classes[c] = run_classes_[r];
    }

    const size_t padding = (4 - p_bytes->count() % 4) % 4;
    uint8_t *    p_new   = p_bytes->add(padding + end);
    if (p_new == nullptr)
        return refuse_memory();
    std::memset(p_new, 0, padding + end);
    p_new += padding;
    *p_offset       = static_cast<kt_uint32_t>(p_new - p_bytes->data());
    const auto copy = [p_new](uint32_t offset, const void * p_from, size_t bytes) {
        if (bytes != 0)
            std::memcpy(p_new + offset, p_from, bytes);
    };
    copy(0, &program, sizeof program);
    copy(program.boundaries_offset, borders_.data(), borders_.count() * sizeof(uint32_t));
    copy(program.run_classes_offset, run_classes_.data(), run_classes_.count() * sizeof(uint16_t));
    copy(program.table_offset, table_.data(), states * class_count_ * sizeof(uint16_t));
    copy(program.flags_offset, state_flags_.data(), states);
    copy(program.instructions_offset, instructions_.data(), instructions * sizeof(ku_regex_instruction_t));
    copy(program.sets_offset, set_bits_.data(), set_bits);
    return 0;
}

} // namespace

kt_int32_t ku_regex_compile(const uint8_t * p, size_t length, const char * p_source, uint32_t * p_work,
                            ku_growable<uint8_t> * p_bytes, kt_uint32_t * p_offset, ku_expr_trouble_t * p_trouble)
{
    ku_regex_tree_t tree;
    if (const kt_int32_t rc = ku_regex_parse(p, length, p_source, &tree, p_trouble); rc != 0)
        return rc;
    builder b(tree, p_source, p_work, p_trouble);
    if (const kt_int32_t rc = b.build(); rc != 0)
        return rc;
    return b.lay_out(p_bytes, p_offset);
}
