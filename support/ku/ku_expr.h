// SPDX-License-Identifier: MIT
// ku_expr: what the parts of the selection language share: tokens, types, the compiled form. Internal.
//
// The road of an expression: ku_expr_parser reads tokens (ku_expr_lexer), checks types (ku_expr_types) and hands
// operations to ku_expr_code, which folds constants, fuses common tests into single instructions and lays all of it
// into one block: the program. ku_expr_eval runs a program on a row. docs/SELECTION.md is the manual of the language.
//
// The program is a list of instructions for a machine with a stack of values. It is in postfix order, so a chain of a
// million operators needs no deeper stack than a chain of two, and no recursion: the machine's stack is as deep as the
// text is nested, which the compiler bounds. The program is read-only once built.
#pragma once

#include <cstddef>
#include <cstdint>
#include <type_traits>

#include "kt_ku.h"
#include "ku_expr_numbers.h"

inline constexpr size_t      ku_expr_longest_text    = 1024 * 1024;
inline constexpr kt_uint32_t ku_expr_deepest_nesting = 250;
// A level of nesting leaves at most seven values unfinished: one for each kind of operator around it.
inline constexpr kt_uint32_t ku_expr_deepest_stack = 7 * (ku_expr_deepest_nesting + 2);

// ---- Types ----

// What a value is to the language. Binaries and resource handles are both bytes to the machine.
enum ku_expr_kind_t : uint8_t {
    KU_KIND_INTEGER,
    KU_KIND_FLOATING,
    KU_KIND_STRING,
    KU_KIND_BINARY,
    KU_KIND_HANDLE,
    KU_KIND_ARRAY,
    KU_KIND_STRUCTURE,
    KU_KIND_OPAQUE // a type that no operator takes
};

ku_expr_kind_t    ku_expr_kind_of_type(kt_data_type_t type);
kt_data_type_t    ku_expr_element_type(kt_data_type_t array_type);
unsigned          ku_expr_unsigned_width(kt_data_type_t type); // 32, 64, or 0 if not unsigned
const kt_char_t * ku_expr_kind_name(ku_expr_kind_t kind);      // with its article: "a string"

inline bool ku_expr_is_number(ku_expr_kind_t kind)
{
    return kind == KU_KIND_INTEGER || kind == KU_KIND_FLOATING;
}

inline bool ku_expr_is_bytes(ku_expr_kind_t kind)
{
    return kind == KU_KIND_BINARY || kind == KU_KIND_HANDLE;
}

// Reads a string literal as bytes: "0x0a1f", or the six words of a resource handle. Writes at most half as many bytes
// as the literal has to p_bytes. False: the literal has neither form.
bool ku_expr_bytes_of_literal(const uint8_t * p_text, size_t length, uint8_t * p_bytes, size_t * p_count);

// ---- Tokens ----

enum ku_token_kind_t : uint8_t {
    KU_TOKEN_END,
    KU_TOKEN_INTEGER,
    KU_TOKEN_FLOATING,
    KU_TOKEN_STRING,
    KU_TOKEN_NAME,
    KU_TOKEN_OPEN,
    KU_TOKEN_CLOSE,
    KU_TOKEN_OPEN_BRACKET,
    KU_TOKEN_CLOSE_BRACKET,
    KU_TOKEN_COMMA,
    KU_TOKEN_DOT,
    KU_TOKEN_EQ,
    KU_TOKEN_NE,
    KU_TOKEN_LT,
    KU_TOKEN_LE,
    KU_TOKEN_GT,
    KU_TOKEN_GE,
    KU_TOKEN_MATCH,
    KU_TOKEN_NO_MATCH,
    KU_TOKEN_AND_ALSO,
    KU_TOKEN_OR_ELSE,
    KU_TOKEN_NOT,
    KU_TOKEN_AND,
    KU_TOKEN_XOR,
    KU_TOKEN_OR,
    KU_TOKEN_PLUS,
    KU_TOKEN_MINUS,
    KU_TOKEN_STAR,
    KU_TOKEN_SLASH,
    KU_TOKEN_PERCENT,
    KU_TOKEN_TILDE
};

struct ku_token_t {
    ku_token_kind_t kind;
    bool            escaped; // a string of the form $"..."
    const char *    p_start;
    const char *    p_end;     // behind the token
    const char *    p_content; // of a string, between its quotes
    const char *    p_contents_end;
    uint64_t        integer;
    double          floating;
};

// Where and why a text was refused.
struct ku_expr_trouble_t {
    kt_int32_t   code;
    const char * p_at;
    char         text[400];
};

// Fills in the trouble and returns its code.
[[nodiscard, gnu::format(printf, 4, 5)]] kt_int32_t ku_expr_refuse(ku_expr_trouble_t * p_trouble, kt_int32_t code,
                                                                   const char * p_at, const char * p_format, ...);

// Reads the token that starts at or behind p, which is followed somewhere by p_end, where a NUL stands. The text is
// UTF-8.
[[nodiscard]] kt_int32_t ku_expr_read_token(const char * p, const char * p_end, ku_token_t * p_token,
                                            ku_expr_trouble_t * p_trouble);

// Writes what a string token stands for; never more bytes than the token has. Returns their number.
size_t ku_expr_decode_string(const ku_token_t & token, char * p_to);

// Whether the name token is this word (given in lower case), in letters of any case.
bool ku_token_is_word(const ku_token_t & token, const char * p_word);

// ---- The program ----

// The machine's operations. The first group leaves one value more on the stack, or replaces values at its top; tests
// leave a truth value or jump on it.
enum ku_operation_t : uint8_t {
    KU_OP_END, // the truth value at the top is the result

    KU_OP_INTEGER,  // pushes a constant
    KU_OP_FLOATING, // pushes a constant
    KU_OP_TEXT,     // pushes constant bytes
    KU_OP_COLUMN,   // pushes the column `operand` of type `detail`

    KU_OP_FIELD,   // structure -> its field `operand`, of type `detail`
    KU_OP_ELEMENT, // array of elements of type `detail`, index -> element
    KU_OP_COUNT,   // array or structure -> number of elements
    KU_OP_LENGTH,  // string or bytes -> number of bytes
    KU_OP_LETTERS, // string -> the same string with its ASCII letters changed as `detail` says

    KU_OP_TO_FLOATING,        // top
    KU_OP_SECOND_TO_FLOATING, // below the top
    KU_OP_NEGATE_INTEGER,
    KU_OP_NEGATE_FLOATING,
    KU_OP_COMPLEMENT, // `detail`: width
    KU_OP_ADD_INTEGERS,
    KU_OP_SUBTRACT_INTEGERS,
    KU_OP_MULTIPLY_INTEGERS,
    KU_OP_DIVIDE_INTEGERS,
    KU_OP_MODULO_INTEGERS,
    KU_OP_AND_INTEGERS,
    KU_OP_XOR_INTEGERS,
    KU_OP_OR_INTEGERS,
    KU_OP_ADD_FLOATINGS,
    KU_OP_SUBTRACT_FLOATINGS,
    KU_OP_MULTIPLY_FLOATINGS,
    KU_OP_DIVIDE_FLOATINGS,

    KU_OP_LIST_ELEMENT,  // pops an element; if it equals the value below: that becomes the answer, jump to `target`
    KU_OP_LIST_CONSTANT, // the same with a constant as the element
    KU_OP_LIST_END,      // the value at the top becomes the answer "not found"

    // Tests of a column against constants; they need nothing on the stack. `operand`: the column.
    KU_OP_FIRST_TEST,
    KU_OP_INT32_IN_RANGE = KU_OP_FIRST_TEST,
    KU_OP_UINT32_IN_RANGE,
    KU_OP_INT64_IN_RANGE,
    KU_OP_UINT64_IN_RANGE,
    KU_OP_FLOAT32_IS, // `detail`: the relation, one that NaN doesn't satisfy
    KU_OP_FLOAT64_IS, // the same
    KU_OP_INT32_IN_SET,
    KU_OP_UINT32_IN_SET,
    KU_OP_INT64_IN_SET,
    KU_OP_UINT64_IN_SET,
    KU_OP_FLOAT32_IN_SET,
    KU_OP_FLOAT64_IN_SET,
    KU_OP_STRING_IS, // `detail`: the relation
    KU_OP_STRING_IN_SET,
    KU_OP_STRING_STARTS_WITH,
    KU_OP_STRING_ENDS_WITH,
    KU_OP_STRING_CONTAINS,
    KU_OP_LAST_COLUMN_TEST = KU_OP_STRING_CONTAINS,

    // Tests of values on the stack. `detail`: the relation of a comparison.
    KU_OP_COMPARE_INTEGERS,
    KU_OP_COMPARE_FLOATINGS,
    KU_OP_COMPARE_INTEGER_WITH_FLOATING,
    KU_OP_COMPARE_FLOATING_WITH_INTEGER,
    KU_OP_COMPARE_STRINGS,
    KU_OP_EQUAL_BYTES,
    KU_OP_LIKE,
    KU_OP_MATCHES, // `operand`: where the regular expression lies in the texts
    KU_OP_INTEGER_IS_TRUE,
    KU_OP_FLOATING_IS_TRUE,
    KU_OP_VALUE_IN_ARRAY,  // value, array; `detail`: type of the elements, `operand`: kind of the value
    KU_OP_ARRAY_HAS_VALUE, // array, value
    KU_OP_LAST_TEST = KU_OP_ARRAY_HAS_VALUE
};

inline bool ku_operation_is_test(uint8_t operation)
{
    return operation >= KU_OP_FIRST_TEST && operation <= KU_OP_LAST_TEST;
}

inline bool ku_operation_is_column_test(uint8_t operation)
{
    return operation >= KU_OP_FIRST_TEST && operation <= KU_OP_LAST_COLUMN_TEST;
}

// What a test does with its truth value: pushes it, or, if it decides a chain of && or ||, pushes it and jumps, and
// otherwise leaves nothing.
enum ku_after_t : uint8_t { KU_AFTER_PUSH, KU_AFTER_JUMP_IF_FALSE, KU_AFTER_JUMP_IF_TRUE };

// How KU_OP_LETTERS and string values say which letters they show.
enum ku_letters_t : uint8_t { KU_LETTERS_AS_THEY_ARE, KU_LETTERS_LOWER, KU_LETTERS_UPPER };

// What KU_OP_LIST_ELEMENT and KU_OP_VALUE_IN_ARRAY compare.
enum ku_pair_t : uint8_t {
    KU_PAIR_INTEGERS,
    KU_PAIR_FLOATINGS,
    KU_PAIR_INTEGER_WITH_FLOATING,
    KU_PAIR_FLOATING_WITH_INTEGER,
    KU_PAIR_STRINGS,
    KU_PAIR_BYTES
};

struct ku_instruction_t {
    uint8_t     operation;
    uint8_t     after;    // ku_after_t
    uint8_t     negated;  // 1: the truth value is the opposite
    uint8_t     detail;   // type, relation, width, letters, pair
    kt_uint32_t operand;  // column, field, place of a regular expression
    kt_uint32_t target;   // index of an instruction
    kt_uint32_t constant; // index of a constant
};
static_assert(sizeof(ku_instruction_t) == 16);

union ku_constant_t {
    ku_int_t integer;
    double   floating;
    struct {
        uint64_t low;  // the lowest 64-bit pattern of the range
        uint64_t span; // the distance to the highest
    } range;
    struct {
        kt_uint32_t offset; // in the program's texts
        kt_uint32_t length;
        uint64_t    first_bytes; // in tests of columns: as they lie in memory, and then zeros
    } text;
    struct {
        kt_uint32_t members; // the next so many constants
    } set;
    struct {
        uint64_t    key;
        kt_uint32_t offset; // of a string, in the program's texts
        kt_uint32_t length;
    } member; // of a set: see ku_expr_sets.h
};
static_assert(sizeof(ku_constant_t) == 16);

// A program is one block: this head, the constants, the instructions, and the texts, which hold literals and regular
// expressions.
struct ku_program_t {
    kt_uint32_t columns_needed; // one more than the highest column read
    kt_uint32_t stack_needed;   // values that lie on the stack at most
    kt_uint32_t instructions_offset;
    kt_uint32_t texts_offset;

    const ku_constant_t *    constants() const { return reinterpret_cast<const ku_constant_t *>(this + 1); }
    const ku_instruction_t * instructions() const
    {
        return reinterpret_cast<const ku_instruction_t *>(bytes() + instructions_offset);
    }
    const uint8_t * texts() const { return bytes() + texts_offset; }
    const uint8_t * bytes() const { return reinterpret_cast<const uint8_t *>(this); }
};
static_assert(sizeof(ku_program_t) == 16 && std::is_trivially_copyable_v<ku_program_t>);

// Compiles. The text is p_text up to p_end, where a NUL stands.
[[nodiscard]] kt_int32_t ku_expr_compile(const char * p_text, const char * p_end, ku_validate_callback_t * p_callback,
                                         void * p_token, ku_program_t ** p_p_program, ku_expr_trouble_t * p_trouble);

struct ku_row_t;

// Runs the program on a row from an instruction on, ahead of which nothing is left on the stack.
[[nodiscard]] kt_int32_t ku_expr_run(const ku_program_t & program, const ku_instruction_t * p_first,
                                     const ku_row_t & row, kt_uint32_t * p_result);

// Which of the rows the program is true of. Bit i of the sets stands for p_p_rows[i].
[[nodiscard]] uint64_t ku_expr_run_on_rows(const ku_program_t & program, const ku_row_form_t & form,
                                           const void * const * p_p_rows, uint64_t rows);

// ---- Patterns ----

// A string whose letters may be shown changed.
struct ku_text_t {
    const uint8_t * p;
    size_t          length;
    uint8_t         letters; // ku_letters_t
};

struct ku_letter_tables_t {
    uint8_t shown[3][256]; // by ku_letters_t and byte
};

consteval ku_letter_tables_t ku_make_letter_tables()
{
    ku_letter_tables_t result{};
    for (unsigned byte = 0; byte < 256; byte++) {
        const bool upper = byte >= 'A' && byte <= 'Z', lower = byte >= 'a' && byte <= 'z';
        result.shown[KU_LETTERS_AS_THEY_ARE][byte] = static_cast<uint8_t>(byte);
        result.shown[KU_LETTERS_LOWER][byte]       = static_cast<uint8_t>(upper ? byte - 'A' + 'a' : byte);
        result.shown[KU_LETTERS_UPPER][byte]       = static_cast<uint8_t>(lower ? byte - 'a' + 'A' : byte);
    }
    return result;
}
inline constexpr ku_letter_tables_t ku_letter_tables = ku_make_letter_tables();

// The language's `like`. Time in proportion to text times pattern at worst.
bool ku_like_matches(const ku_text_t & text, const ku_text_t & pattern);

enum ku_like_class_t : uint8_t { KU_LIKE_EQUALS, KU_LIKE_STARTS, KU_LIKE_ENDS, KU_LIKE_CONTAINS, KU_LIKE_GENERAL };

// What a constant pattern amounts to. Unless general, p_literal (as long as the pattern) gets the bytes looked for.
ku_like_class_t ku_like_classify(const uint8_t * p_pattern, size_t length, uint8_t * p_literal,
                                 size_t * p_literal_length);
