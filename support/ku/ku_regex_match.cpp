// SPDX-License-Identifier: MIT
// ku_regex_match: searches a text for a regular expression.
//
// Always holds: each character of the text is looked at once. With a table that is a step a character; without, the
// threads of the nondeterministic automaton move together, so it is at most a step an instruction.
// Locking: none; the program is read-only, and all scratch memory is on the stack.
#include "ku_regex.h"
#include "ku_utf8.h"

#include <algorithm>

bool ku_regex_follow(const ku_regex_instruction_t * p_instructions, uint16_t from, unsigned where,
                     ku_regex_threads_t * p_threads)
{
    // An instruction is put on the list of those to look at only when it becomes a member, so the list has room.
    uint16_t to_look_at[ku_regex_most_instructions];
    size_t   count    = 0;
    bool     matches  = false;
    uint16_t new_ones = from;
    // Splits and conditions that hold are members too while this runs: they mark where it has been.
    const auto enter = [&](uint16_t i) {
        if (!p_threads->has(i)) {
            p_threads->add(i);
            to_look_at[count++] = i;
        }
    };
    enter(new_ones);
    while (count != 0) {
        const ku_regex_instruction_t & instruction = p_instructions[to_look_at[--count]];
        switch (instruction.operation) {
        case KU_REGEX_OP_SPLIT:
            enter(instruction.a);
            enter(instruction.b);
            break;
        case KU_REGEX_OP_START:
            if ((where & KU_REGEX_AT_START) != 0)
                enter(instruction.a);
            break;
        case KU_REGEX_OP_END:
            if ((where & KU_REGEX_AT_END) != 0)
                enter(instruction.a);
            break;
        case KU_REGEX_OP_MATCH:
            matches = true;
            break;
        default:
            break;
        }
    }
    return matches;
}

namespace
{

// The characters of a text as classes.
class class_reader
{
  public:
    class_reader(const ku_regex_program_t & program, const ku_text_t & text)
        : program_(program), p_(text.p), p_end_(text.p + text.length), shown_(ku_letter_tables.shown[text.letters])
    {
    }
    bool     is_at_end() const { return p_ == p_end_; }
    uint16_t next()
    {
        if (*p_ < 0x80)
            return program_.ascii_classes[shown_[*p_++]];
        uint32_t     character = 0;
        const size_t length    = ku_utf8_read(p_, p_end_, &character);
        if (length == 0) {
            p_++;
            return static_cast<uint16_t>(program_.class_count - 1);
        }
        p_ += length;
        const uint32_t * p_first = program_.at<uint32_t>(program_.boundaries_offset);
        const uint32_t * p_run   = std::upper_bound(p_first, p_first + program_.boundary_count, character) - 1;
        return program_.at<uint16_t>(program_.run_classes_offset)[p_run - p_first];
    }

  private:
    const ku_regex_program_t & program_;
    const uint8_t *            p_;
    const uint8_t * const      p_end_;
    const uint8_t * const      shown_;
};

bool search_by_table(const ku_regex_program_t & program, class_reader reader)
{
    const uint16_t * p_table = program.at<uint16_t>(program.table_offset);
    const uint8_t *  p_flags = program.at<uint8_t>(program.flags_offset);
    size_t           state   = 0;
    while ((p_flags[state] & (KU_REGEX_STATE_MATCHES | KU_REGEX_STATE_IS_HOPELESS)) == 0) {
        if (reader.is_at_end())
            return (p_flags[state] & KU_REGEX_STATE_MATCHES_AT_END) != 0;
        state = p_table[state * program.class_count + reader.next()];
    }
    return (p_flags[state] & KU_REGEX_STATE_MATCHES) != 0;
}

bool search_by_threads(const ku_regex_program_t & program, class_reader reader)
{
    const auto *       p_instructions = program.at<ku_regex_instruction_t>(program.instructions_offset);
    const uint8_t *    p_sets         = program.at<uint8_t>(program.sets_offset);
    ku_regex_threads_t rooms[2];
    for (ku_regex_threads_t & room : rooms) {
        room.clear();
        std::fill_n(room.places, program.instruction_count, static_cast<uint16_t>(0));
    }
    ku_regex_threads_t *p_now = &rooms[0], *p_next = &rooms[1];
    unsigned            where = KU_REGEX_AT_START | (reader.is_at_end() ? KU_REGEX_AT_END : 0u);
    if (ku_regex_follow(p_instructions, program.start, where, p_now))
        return true;
    while (!reader.is_at_end()) {
        const uint16_t a_class = reader.next();
        where                  = reader.is_at_end() ? KU_REGEX_AT_END : 0u;
        p_next->clear();
        for (uint16_t i = 0; i < p_now->count; i++) {
            const ku_regex_instruction_t & instruction = p_instructions[p_now->members[i]];
            if (instruction.operation != KU_REGEX_OP_SET)
                continue;
            const uint8_t * p_set = p_sets + instruction.b * static_cast<size_t>(program.set_bytes);
            if ((p_set[a_class / 8u] >> a_class % 8 & 1) != 0 &&
                ku_regex_follow(p_instructions, instruction.a, where, p_next))
                return true;
        }
        if (ku_regex_follow(p_instructions, program.start, where, p_next))
            return true;
        std::swap(p_now, p_next);
    }
    return false;
}

} // namespace

bool ku_regex_is_found(const ku_regex_program_t & program, const ku_text_t & text)
{
    const class_reader reader(program, text);
    return program.state_count != 0 ? search_by_table(program, reader) : search_by_threads(program, reader);
}
