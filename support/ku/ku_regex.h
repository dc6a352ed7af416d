// SPDX-License-Identifier: MIT
// ku_regex: POSIX extended regular expressions over UTF-8, for the selection language. Internal.
//
// They are compiled once into a read-only program without pointers and searched for in time proportional to the text,
// with no allocation and no recursion: none of which regcomp and regexec promise. Only whether there is a match is
// asked, so the rules about which match is the longest play no part.
//
// The alphabet of a program is not bytes or characters but classes: runs of characters between which the expression
// makes no difference. The program is a nondeterministic automaton over classes and, as far as it stays small, a table
// of a deterministic one.
#pragma once

#include <cstddef>
#include <cstdint>

#include "ku_expr.h"
#include "ku_growable.h"

// Limits, so that compiling is bounded in time and memory whatever the text.
inline constexpr size_t   ku_regex_most_nodes        = 8192;
inline constexpr size_t   ku_regex_most_ranges       = 2048;
inline constexpr size_t   ku_regex_most_instructions = 2000;
inline constexpr size_t   ku_regex_most_table_cells  = 32768;
inline constexpr unsigned ku_regex_deepest_nesting   = 250;
inline constexpr unsigned ku_regex_most_repeats      = 255; // in {m,n}, which is what POSIX promises
// Steps that the regular expressions of one selection expression may cost together. When less than half are left, or
// one of them would take more than its share, automata stay nondeterministic.
inline constexpr uint32_t ku_regex_work       = 16 * 1024 * 1024;
inline constexpr uint32_t ku_regex_table_work = 2 * 1024 * 1024;

// ---- The expression as a tree ----

enum ku_regex_node_kind_t : uint8_t {
    KU_REGEX_NOTHING,
    KU_REGEX_SET,
    KU_REGEX_START, // ^
    KU_REGEX_END,   // $
    KU_REGEX_SEQUENCE,
    KU_REGEX_CHOICE,
    KU_REGEX_REPEAT
};

inline constexpr uint32_t ku_regex_none     = UINT32_MAX;
inline constexpr uint16_t ku_regex_no_limit = UINT16_MAX;

struct ku_regex_node_t {
    ku_regex_node_kind_t kind;
    uint16_t             minimum; // of a repeat
    uint16_t             maximum; // of a repeat, or ku_regex_no_limit
    uint32_t             last_child;
    uint32_t             previous; // sibling: automata are built from their end
    uint32_t             set;
};

struct ku_regex_range_t {
    uint32_t first; // characters, both included
    uint32_t last;
};

struct ku_regex_set_t {
    uint32_t first_range;
    uint32_t range_count;
    bool     inverted;
};

struct ku_regex_tree_t {
    ku_growable<ku_regex_node_t>  nodes;
    ku_growable<ku_regex_range_t> ranges;
    ku_growable<ku_regex_set_t>   sets;
    uint32_t                      root;
};

// Reads the expression. p_source is the text that it was written in, for the trouble: *p_trouble gets the reason, and
// the place p_source.
[[nodiscard]] kt_int32_t ku_regex_parse(const uint8_t * p, size_t length, const char * p_source,
                                        ku_regex_tree_t * p_tree, ku_expr_trouble_t * p_trouble);

// ---- The program ----

enum ku_regex_operation_t : uint16_t {
    KU_REGEX_OP_SET,   // consumes a character of the set `b`, goes on at `a`
    KU_REGEX_OP_SPLIT, // goes on at `a` and at `b`
    KU_REGEX_OP_START, // goes on at `a` at the start of the text
    KU_REGEX_OP_END,   // goes on at `a` at the end of the text
    KU_REGEX_OP_MATCH
};

struct ku_regex_instruction_t {
    uint16_t operation;
    uint16_t a;
    uint16_t b;
};

enum : uint8_t { KU_REGEX_STATE_MATCHES = 1, KU_REGEX_STATE_MATCHES_AT_END = 2, KU_REGEX_STATE_IS_HOPELESS = 4 };

// One block; what follows the head is addressed by offsets from it.
struct ku_regex_program_t {
    uint32_t size;           // bytes of the whole
    uint16_t class_count;    // with the last one, that of bytes that are no character
    uint16_t boundary_count; // uint32_t[]: where runs of characters start, ascending, the first is 0
    uint16_t state_count;    // of the deterministic automaton; 0: there is none
    uint16_t instruction_count;
    uint16_t start;     // instruction
    uint16_t set_bytes; // of the bits of one set, one bit for each class
    uint32_t boundaries_offset;
    uint32_t run_classes_offset; // uint16_t[]: the class of each run
    uint32_t table_offset;       // uint16_t[]: state * class_count + class -> state
    uint32_t flags_offset;       // uint8_t[]: of each state
    uint32_t instructions_offset;
    uint32_t sets_offset; // uint8_t[]
    uint16_t ascii_classes[128];

    template <class T> const T * at(uint32_t offset) const
    {
        return reinterpret_cast<const T *>(reinterpret_cast<const uint8_t *>(this) + offset);
    }
};

// Appends the program for the expression to the bytes, at a multiple of four, and tells where. *p_work goes down.
[[nodiscard]] kt_int32_t ku_regex_compile(const uint8_t * p, size_t length, const char * p_source, uint32_t * p_work,
                                          ku_growable<uint8_t> * p_bytes, kt_uint32_t * p_offset,
                                          ku_expr_trouble_t * p_trouble);

// Whether the expression is found anywhere in the text.
bool ku_regex_is_found(const ku_regex_program_t & program, const ku_text_t & text);

// ---- Running it nondeterministically; the table is built by the same steps ----

// A set of instructions that can be emptied at once.
struct ku_regex_threads_t {
    uint16_t count;
    uint16_t members[ku_regex_most_instructions];
    uint16_t places[ku_regex_most_instructions];

    void clear() { count = 0; }
    bool has(uint16_t i) const { return places[i] < count && members[places[i]] == i; }
    void add(uint16_t i)
    {
        places[i]        = count;
        members[count++] = i;
    }
};

enum : unsigned { KU_REGEX_AT_START = 1, KU_REGEX_AT_END = 2 };

// Adds the instruction and all that follow it without consuming anything. Returns whether a match is among them.
bool ku_regex_follow(const ku_regex_instruction_t * p_instructions, uint16_t from, unsigned where,
                     ku_regex_threads_t * p_threads);
