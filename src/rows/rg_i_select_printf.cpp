// SPDX-License-Identifier: MIT
// rg_i_select_printf: renders selection criteria from a format with "$" variables and the values for them.
//
// Layer: rows. Called by the calls that take criteria; calls nothing but the C library.
// Always holds: the text is one allocation that grows in steps of 4096 bytes and is terminated at the end only.
// Numbers are rendered with the point of the selection language, whatever the process's locale.
// Locking: none; the callers hold a table's lock.
// Failure: what was rendered so far stays in *result, for the caller to free.
#include <locale.h>

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_trace.h"
#include "rows/rg_i_criteria.h"

namespace
{

constexpr char module_version[] = "rg_i_select_printf 1.0";

constexpr kt_uint32_t growth_step = 4096;

// Takes any number in full: the longest is a double of 309 digits, a sign and six decimals.
constexpr size_t number_room = 512;

// The text under construction.
struct text_t {
    kt_char_ptr_t * p_result; // the caller's
    kt_char_ptr_t   p_to;     // where the next byte goes
    kt_uint32_t     current_bytes;
    kt_uint32_t     maximum_bytes;

    [[nodiscard]] kt_int32_t append(const kt_char_t * p_bytes, size_t length)
    {
        if (length > UINT32_MAX)
            return rg_i_fail_no_memory(RG_HERE);
        return rg_i_append_buffer_to_result(&current_bytes, &maximum_bytes, static_cast<kt_uint32_t>(length), p_result,
                                            &p_to, p_bytes);
    }
    [[nodiscard]] kt_int32_t make_room(size_t length) { return append(nullptr, length); }
};

// A locale of the "C" kind for the calling thread while it lives. Without one (no memory) the process's own stays.
class plain_numbers
{
  public:
    plain_numbers() : plain_(newlocale(LC_NUMERIC_MASK, "C", static_cast<locale_t>(nullptr)))
    {
        if (plain_ != nullptr)
            former_ = uselocale(plain_);
    }
    ~plain_numbers()
    {
        if (plain_ == nullptr)
            return;
        uselocale(former_);
        freelocale(plain_);
    }
    plain_numbers(const plain_numbers &)                = delete;
    plain_numbers &    operator=(const plain_numbers &) = delete;
    [[nodiscard]] bool made() const { return plain_ != nullptr; }

  private:
    locale_t plain_;
    locale_t former_ = nullptr;
};

template <class T> [[nodiscard]] kt_int32_t append_integer(text_t & text, const char * p_format, T value)
{
    char      buffer[number_room];
    const int length = std::snprintf(buffer, sizeof buffer, p_format, value);
    return text.append(buffer, static_cast<size_t>(length));
}

[[nodiscard]] kt_int32_t append_double(text_t & text, const char * p_format, double value)
{
    char                buffer[number_room];
    const plain_numbers numbers;
    if (!numbers.made())
        return rg_i_fail_no_memory(RG_HERE);
    const int length = std::snprintf(buffer, sizeof buffer, p_format, value);
    return text.append(buffer, static_cast<size_t>(length));
}

// Kept because callers depend on it: nothing in the string is escaped, so that a quote in it ends the literal.
[[nodiscard]] kt_int32_t append_string(text_t & text, const kt_char_t * p_string)
{
    if (p_string == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (const kt_int32_t rc = text.append("\"", 1); rc != 0)
        return rc;
    if (const kt_int32_t rc = text.append(p_string, std::strlen(p_string)); rc != 0)
        return rc;
    return text.append("\"", 1);
}

[[nodiscard]] kt_int32_t append_binary(text_t & text, const kt_binary_t * p_binary)
{
    if (p_binary == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (const kt_int32_t rc = text.append("\"0x", 3); rc != 0)
        return rc;
    const size_t digits = 2 * static_cast<size_t>(p_binary->length);
    if (const kt_int32_t rc = text.make_room(digits); rc != 0)
        return rc;
    for (kt_uint32_t i = 0; i < p_binary->length; ++i) {
        constexpr char hexadecimal[] = "0123456789abcdef";
        *text.p_to++                 = hexadecimal[p_binary->data[i] >> 4];
        *text.p_to++                 = hexadecimal[p_binary->data[i] & 15];
    }
    text.current_bytes += static_cast<kt_uint32_t>(digits);
    return text.append("\"", 1);
}

[[nodiscard]] kt_int32_t append_resource_handle(text_t & text, const kt_resource_handle_t * p_handle)
{
    if (p_handle == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    char      buffer[number_room];
    const int length =
        std::snprintf(buffer, sizeof buffer, "\"0x%04x 0x%04x 0x%08x 0x%08x 0x%08x 0x%08x\"", p_handle->header & 0xFFFF,
                      p_handle->header >> 16, p_handle->id.id1, p_handle->id.id2, p_handle->id.id3, p_handle->id.id4);
    return text.append(buffer, static_cast<size_t>(length));
}

// What a variable stands for, told by the one or two characters behind its "$".
enum class variable { int32, int64, uint32, uint64, fixed, general, string, binary, handle, quote, none };

[[nodiscard]] kt_char_t in_lower_case(kt_char_t c)
{
    return c >= 'A' && c <= 'Z' ? static_cast<kt_char_t>(c - 'A' + 'a') : c;
}

// Also tells how many characters the variable takes behind its "$".
[[nodiscard]] variable variable_at(const kt_char_t * p, kt_uint32_t * p_length)
{
    *p_length = 1;
    switch (in_lower_case(p[0])) {
    case 'i':
        return variable::int32;
    case 'l':
        return variable::int64;
    case 'f':
        return variable::fixed;
    case 'd':
        return variable::general;
    case 's':
        return variable::string;
    case 'b':
        return variable::binary;
    case '"':
    case '\'':
        return variable::quote;
    case 'u':
        *p_length = 2;
        return in_lower_case(p[1]) == 'i'   ? variable::uint32
               : in_lower_case(p[1]) == 'l' ? variable::uint64
                                            : variable::none;
    case 'r':
        *p_length = 2;
        return in_lower_case(p[1]) == 'h' ? variable::handle : variable::none;
    default:
        return variable::none;
    }
}

} // namespace

kt_int32_t rg_i_append_buffer_to_result(kt_uint32_t * currentResultBytes, kt_uint32_t * maxResultBytes,
                                        kt_uint32_t length, kt_char_ptr_t * result, kt_char_ptr_t * to,
                                        const kt_char_t * buffer)
{
    const kt_uint64_t wanted  = kt_uint64_t{*currentResultBytes} + length;
    kt_uint64_t       maximum = *maxResultBytes;
    if (wanted > maximum)
        maximum += (wanted - maximum + growth_step - 1) / growth_step * growth_step;
    if (maximum != *maxResultBytes) {
        kt_char_ptr_t p_grown =
            maximum <= UINT32_MAX ? static_cast<kt_char_ptr_t>(std::realloc(*result, maximum)) : nullptr;
        if (p_grown == nullptr) {
            std::free(*result);
            *result = nullptr;
            return rg_i_fail_no_memory(RG_HERE);
        }
        *result         = p_grown;
        *to             = p_grown + *currentResultBytes;
        *maxResultBytes = static_cast<kt_uint32_t>(maximum);
    }
    if (buffer == nullptr)
        return 0;

    std::memcpy(*to, buffer, length);
    *to += length;
    *currentResultBytes += length;
    return 0;
}

kt_int32_t rg_i_select_printf(kt_char_ptr_t * result, kt_char_ptr_t selectionCriteria, va_list ap)
{
    *result = static_cast<kt_char_ptr_t>(std::malloc(growth_step));
    if (*result == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    text_t            text{result, *result, 0, growth_step};
    const kt_char_t * p_from = selectionCriteria;
    for (;;) {
        const size_t plain = std::strcspn(p_from, "$");
        if (const kt_int32_t rc = text.append(p_from, plain); rc != 0)
            return rc;
        p_from += plain;
        if (*p_from == '\0')
            break;

        kt_uint32_t    length  = 0;
        kt_int32_t     rc      = 0;
        const variable the_one = variable_at(p_from + 1, &length);
        switch (the_one) {
        case variable::int32:
            rc = append_integer(text, "%-d", va_arg(ap, kt_int32_t));
            break;
        case variable::int64:
            rc = append_integer(text, "%-" PRId64, va_arg(ap, kt_int64_t));
            break;
        case variable::uint32:
            rc = append_integer(text, "%-u", va_arg(ap, kt_uint32_t));
            break;
        case variable::uint64:
            rc = append_integer(text, "%-" PRIu64, va_arg(ap, kt_uint64_t));
            break;
        case variable::fixed:
            rc = append_double(text, "%-f", va_arg(ap, double));
            break;
        case variable::general:
            rc = append_double(text, "%-g", va_arg(ap, double));
            break;
        case variable::string:
            rc = append_string(text, va_arg(ap, const kt_char_t *));
            break;
        case variable::binary:
            rc = append_binary(text, va_arg(ap, const kt_binary_t *));
            break;
        case variable::handle:
            rc = append_resource_handle(text, va_arg(ap, const kt_resource_handle_t *));
            break;
        case variable::quote:
            rc = text.append(p_from, 2); // both characters as they stand: a string with escapes begins like this
            break;
        case variable::none:
            return rg_i_fail_invalid_variable(RG_HERE, selectionCriteria);
        }
        if (rc != 0)
            return rc;
        p_from += 1 + length;
    }

    if (const kt_int32_t rc = text.make_room(1); rc != 0)
        return rc;
    *text.p_to = '\0';
    return 0;
}
