// SPDX-License-Identifier: MIT
// expression_fuzz: the compiler and the evaluator of the selection language on any text and any row.
//
// The input is the text, a NUL, the row's slots and its indirect data. Each goes into a block of exactly its size, so
// that the sanitizers see a step outside. Whatever happens must be one of the codes, with a diagnosis exactly if the
// text was refused, and running twice, or on the row among others, must give the same answer.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "kt_ku.h"

namespace
{

struct column {
    const char *   p_name;
    kt_data_type_t type;
};

constexpr column      columns[]    = {{"i", KT_INT32},
                                      {"u", KT_UINT32},
                                      {"l", KT_INT64},
                                      {"v", KT_UINT64},
                                      {"f", KT_FLOAT32},
                                      {"d", KT_FLOAT64},
                                      {"s", KT_CHAR_PTR},
                                      {"t", KT_CHAR_PTR},
                                      {"b", KT_BINARY_PTR},
                                      {"h", KT_RSRC_HANDLE_PTR},
                                      {"x", KT_SD_PTR},
                                      {"ai", KT_INT32_ARRAY},
                                      {"au", KT_UINT32_ARRAY},
                                      {"al", KT_INT64_ARRAY},
                                      {"av", KT_UINT64_ARRAY},
                                      {"af", KT_FLOAT32_ARRAY},
                                      {"ad", KT_FLOAT64_ARRAY},
                                      {"as", KT_CHAR_PTR_ARRAY},
                                      {"ab", KT_BINARY_PTR_ARRAY},
                                      {"ah", KT_RSRC_HANDLE_PTR_ARRAY},
                                      {"ax", KT_SD_PTR_ARRAY},
                                      {"o", KT_SBS_PTR}};
constexpr kt_uint32_t column_count = sizeof columns / sizeof columns[0];

// Structured data has a field of each type, under the name of the column of that type.
kt_int32_t answer(void *, kt_char_t * p_name, kt_uint32_t length, kt_uint32_t, ku_validate_data_t * p_data)
{
    if (std::strlen(p_name) != length)
        std::abort();
    for (kt_uint32_t i = 0; i < column_count; i++) {
        if (std::strcmp(columns[i].p_name, p_name) == 0) {
            *p_data = {columns[i].type, i};
            return 0;
        }
    }
    return -1;
}

// Looks at the row together with another that is it too, between two that aren't asked about.
bool matches_among_others(void * p_compiled, const char * p_slots, const char * p_indirect, kt_uint32_t indirect_length)
{
    constexpr kt_uint32_t   slot_bytes = column_count * 8;
    std::unique_ptr<char[]> record(new char[sizeof indirect_length + slot_bytes + indirect_length]);
    char * const            p_row = record.get() + sizeof indirect_length;
    std::memcpy(record.get(), &indirect_length, sizeof indirect_length);
    std::memcpy(p_row, p_slots, slot_bytes);
    if (indirect_length != 0)
        std::memcpy(p_row + slot_bytes, p_indirect, indirect_length);

    const ku_row_form_t form     = {column_count, 0, slot_bytes, -static_cast<kt_int32_t>(sizeof indirect_length), 0};
    const void * const  rows[]   = {nullptr, p_row, nullptr, p_row};
    kt_uint64_t         matching = 0;
    if (ku_exec_expr_on_rows_1(p_compiled, 16, &form, rows, 10, &matching) != 0 || (matching != 0 && matching != 10))
        std::abort();
    return matching != 0;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t * p_data, size_t size)
{
    const void * p_nul = size != 0 ? std::memchr(p_data, '\0', size) : nullptr;
    const size_t text_length =
        p_nul != nullptr ? static_cast<size_t>(static_cast<const uint8_t *>(p_nul) - p_data) : size;
    std::unique_ptr<char[]> text(new char[text_length + 1]);
    if (text_length != 0)
        std::memcpy(text.get(), p_data, text_length);
    text[text_length] = '\0';

    void *           p_compiled = nullptr;
    const kt_int32_t rc         = ku_comp_expr_1(text.get(), 0, answer, nullptr, &p_compiled);
    if (rc < 0 || rc > KU_EXPR_E_NO_MEMORY || (rc == 0) != (*ku_expr_diagnosis_1() == '\0'))
        std::abort();
    if (rc != 0)
        return 0;

    const size_t            slot_bytes = column_count * 8;
    std::unique_ptr<char[]> slots(new char[slot_bytes]());
    const size_t            behind_text = text_length + 1 < size ? size - text_length - 1 : 0;
    const size_t            from_input  = behind_text < slot_bytes ? behind_text : slot_bytes;
    if (from_input != 0)
        std::memcpy(slots.get(), p_data + text_length + 1, from_input);
    const size_t            indirect_length = behind_text - from_input;
    std::unique_ptr<char[]> indirect(new char[indirect_length]);
    if (indirect_length != 0)
        std::memcpy(indirect.get(), p_data + text_length + 1 + from_input, indirect_length);

    kt_uint32_t first = 2, second = 2;
    const auto  run = [&](kt_uint32_t * p_result) {
        return ku_exec_expr_within_1(p_compiled, 16, slots.get(), column_count, p_result, indirect.get(),
                                      static_cast<kt_uint32_t>(indirect_length));
    };
    const kt_int32_t first_rc = run(&first), second_rc = run(&second);
    if (first_rc != second_rc || first != second || (first_rc == 0) != (first < 2) ||
        (first_rc != 0 && (first_rc < KU_EXPR_E_INTEGER_FAULT || first_rc > KU_EXPR_E_DAMAGED_VALUE)))
        std::abort();
    if (matches_among_others(p_compiled, slots.get(), indirect.get(), static_cast<kt_uint32_t>(indirect_length)) !=
        (first == 1))
        std::abort();
    ku_free_expr_1(p_compiled, 0);
    return 0;
}
