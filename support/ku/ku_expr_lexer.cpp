// SPDX-License-Identifier: MIT
// ku_expr_lexer: the tokens of the selection language.
//
// The longest token wins. Words are all names here: whether one is an operator or a function depends on where it
// stands, which the parser knows. The text is well-formed UTF-8 with a NUL at its end, so looking one byte ahead is
// always possible, and bytes of 0x80 and above belong to names and strings only.
// Failure: refused with the place and the reason.
#include "ku_expr.h"

#include <charconv>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <limits>

namespace
{

bool is_space(char c)
{
    return c == ' ' || (c >= '\t' && c <= '\r');
}

bool is_digit(char c)
{
    return c >= '0' && c <= '9';
}

bool starts_name(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_' || static_cast<unsigned char>(c) >= 0x80;
}

bool continues_name(char c)
{
    return starts_name(c) || is_digit(c);
}

int hex_digit(char c)
{
    if (is_digit(c))
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

// ---- Numbers ----

[[nodiscard]] kt_int32_t refuse_large_integer(const ku_token_t & token, ku_expr_trouble_t * p_trouble)
{
    return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, token.p_start, "an integer above 18446744073709551615");
}

[[nodiscard]] kt_int32_t read_integer(const char * p_digits, int base, ku_token_t * p_token,
                                      ku_expr_trouble_t * p_trouble)
{
    const auto result = std::from_chars(p_digits, p_token->p_end, p_token->integer, base);
    if (result.ec != std::errc{})
        return refuse_large_integer(*p_token, p_trouble);
    p_token->kind = KU_TOKEN_INTEGER;
    return 0;
}

// The exponent of the first digit that isn't 0, as in 0.012e3; decides between infinity and 0 when a literal is out of
// range, which from_chars doesn't tell apart.
bool is_above_one(const char * p, const char * p_end)
{
    long position = 0, exponent = 0;
    bool behind_point = false, found = false;
    for (; p < p_end && *p != 'e' && *p != 'E'; p++) {
        if (*p == '.')
            behind_point = true;
        else if (!found && *p != '0')
            found = true;
        if (*p != '.' && found && !behind_point)
            position++;
        else if (*p != '.' && !found && behind_point)
            position--;
    }
    if (p < p_end) {
        p++;
        const bool minus = *p == '-';
        if (*p == '-' || *p == '+')
            p++;
        for (; p < p_end && exponent < 100000000; p++)
            exponent = exponent * 10 + (*p - '0');
        if (minus)
            exponent = -exponent;
    }
    return position + exponent > 0;
}

void read_floating(ku_token_t * p_token)
{
    const auto result = std::from_chars(p_token->p_start, p_token->p_end, p_token->floating);
    if (result.ec != std::errc{})
        p_token->floating =
            is_above_one(p_token->p_start, p_token->p_end) ? std::numeric_limits<double>::infinity() : 0.0;
    p_token->kind = KU_TOKEN_FLOATING;
}

const char * skip_digits(const char * p)
{
    while (is_digit(*p))
        p++;
    return p;
}

// Behind an exponent if one stands at p.
const char * skip_exponent(const char * p)
{
    if (*p != 'e' && *p != 'E')
        return p;
    const char * p_digits = p + 1 + (p[1] == '+' || p[1] == '-' ? 1 : 0);
    return is_digit(*p_digits) ? skip_digits(p_digits) : p;
}

[[nodiscard]] kt_int32_t read_number(ku_token_t * p_token, ku_expr_trouble_t * p_trouble)
{
    const char * p     = p_token->p_start;
    const bool   hex   = p[0] == '0' && p[1] == 'x' && hex_digit(p[2]) >= 0;
    bool         whole = true;
    if (hex) {
        for (p += 2; hex_digit(*p) >= 0;)
            p++;
    } else {
        p = skip_digits(p);
        if (*p == '.' && is_digit(p[1])) {
            whole = false;
            p     = skip_digits(p + 1);
        }
        const char * p_behind = skip_exponent(p);
        whole                 = whole && p_behind == p;
        p                     = p_behind;
    }
    if (starts_name(*p))
        return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p, "a number is directly followed by a letter");
    p_token->p_end = p;
    if (hex)
        return read_integer(p_token->p_start + 2, 16, p_token, p_trouble);
    if (whole)
        return read_integer(p_token->p_start, 10, p_token, p_trouble);
    read_floating(p_token);
    return 0;
}

// ---- Strings ----

// Reads the escape behind a backslash at p, which is below p_end. Writes at most three bytes; false: there is no such
// escape.
bool read_escape(const char *& p, const char * p_end, char * p_bytes, size_t * p_count)
{
    *p_count = 1;
    switch (const char c = *p++; c) {
    case '\\':
    case '"':
    case '\'':
        p_bytes[0] = c;
        return true;
    case 'n':
        p_bytes[0] = '\n';
        return true;
    case 'r':
        p_bytes[0] = '\r';
        return true;
    case 't':
        p_bytes[0] = '\t';
        return true;
    case 'x':
    case 'u': {
        const int digits = c == 'x' ? 2 : 4;
        unsigned  value  = 0;
        for (int i = 0; i < digits; i++, p++) {
            if (p >= p_end || hex_digit(*p) < 0)
                return false;
            value = value * 16 + static_cast<unsigned>(hex_digit(*p));
        }
        if (value == 0 || (value >= 0xD800 && value <= 0xDFFF))
            return false;
        if (c == 'x' || value < 0x80) {
            p_bytes[0] = static_cast<char>(value);
        } else if (value < 0x800) {
            p_bytes[0] = static_cast<char>(0xC0 | value >> 6);
            p_bytes[1] = static_cast<char>(0x80 | (value & 0x3F));
            *p_count   = 2;
        } else {
            p_bytes[0] = static_cast<char>(0xE0 | value >> 12);
            p_bytes[1] = static_cast<char>(0x80 | (value >> 6 & 0x3F));
            p_bytes[2] = static_cast<char>(0x80 | (value & 0x3F));
            *p_count   = 3;
        }
        return true;
    }
    default:
        return false;
    }
}

[[nodiscard]] kt_int32_t refuse_escape(const char * p_backslash, ku_expr_trouble_t * p_trouble)
{
    return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p_backslash,
                          "no such escape: there are \\\\ \\\" \\' \\n \\r \\t, \\x01 to \\xFF, and \\u0001 to \\uFFFF "
                          "without surrogates");
}

// p_token->p_content stands behind the opening quote.
[[nodiscard]] kt_int32_t read_string(const char * p_end, ku_token_t * p_token, ku_expr_trouble_t * p_trouble)
{
    const char   quote = p_token->p_content[-1];
    const char * p     = p_token->p_content;
    while (p < p_end && *p != quote) {
        if (p_token->escaped && *p == '\\') {
            const char * p_backslash = p++;
            char         bytes[3];
            size_t       count = 0;
            if (p >= p_end || !read_escape(p, p_end, bytes, &count))
                return refuse_escape(p_backslash, p_trouble);
        } else {
            p++;
        }
    }
    if (p >= p_end)
        return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p_token->p_start, "a string without its closing %c", quote);
    p_token->kind           = KU_TOKEN_STRING;
    p_token->p_contents_end = p;
    p_token->p_end          = p + 1;
    return 0;
}

// ---- Operators ----

struct operator_text {
    char            text[3];
    ku_token_kind_t kind;
};

// Longer ones first.
constexpr operator_text operators[] = {{"==", KU_TOKEN_EQ},          {"=~", KU_TOKEN_MATCH},
                                       {"!=", KU_TOKEN_NE},          {"!~", KU_TOKEN_NO_MATCH},
                                       {"<>", KU_TOKEN_NE},          {"<=", KU_TOKEN_LE},
                                       {">=", KU_TOKEN_GE},          {"&&", KU_TOKEN_AND_ALSO},
                                       {"||", KU_TOKEN_OR_ELSE},     {"=", KU_TOKEN_EQ},
                                       {"<", KU_TOKEN_LT},           {">", KU_TOKEN_GT},
                                       {"!", KU_TOKEN_NOT},          {"&", KU_TOKEN_AND},
                                       {"^", KU_TOKEN_XOR},          {"|", KU_TOKEN_OR},
                                       {"+", KU_TOKEN_PLUS},         {"-", KU_TOKEN_MINUS},
                                       {"*", KU_TOKEN_STAR},         {"/", KU_TOKEN_SLASH},
                                       {"%", KU_TOKEN_PERCENT},      {"~", KU_TOKEN_TILDE},
                                       {"(", KU_TOKEN_OPEN},         {")", KU_TOKEN_CLOSE},
                                       {"[", KU_TOKEN_OPEN_BRACKET}, {"]", KU_TOKEN_CLOSE_BRACKET},
                                       {",", KU_TOKEN_COMMA},        {".", KU_TOKEN_DOT}};

[[nodiscard]] kt_int32_t read_operator(ku_token_t * p_token, ku_expr_trouble_t * p_trouble)
{
    for (const operator_text & o : operators) {
        const size_t length = std::strlen(o.text);
        if (std::strncmp(p_token->p_start, o.text, length) == 0) {
            p_token->kind  = o.kind;
            p_token->p_end = p_token->p_start + length;
            return 0;
        }
    }
    const char c = *p_token->p_start;
    if (c == '$')
        return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p_token->p_start, "a $ that no quote follows");
    if (c < ' ' || c == '\x7F')
        return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p_token->p_start, "the control character 0x%02x", c);
    return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p_token->p_start, "'%c' has no meaning here", c);
}

} // namespace

kt_int32_t ku_expr_refuse(ku_expr_trouble_t * p_trouble, kt_int32_t code, const char * p_at, const char * p_format, ...)
{
    p_trouble->code = code;
    p_trouble->p_at = p_at;
    va_list arguments;
    va_start(arguments, p_format);
    vsnprintf(p_trouble->text, sizeof p_trouble->text, p_format, arguments);
    va_end(arguments);
    return code;
}

kt_int32_t ku_expr_read_token(const char * p, const char * p_end, ku_token_t * p_token, ku_expr_trouble_t * p_trouble)
{
    while (is_space(*p))
        p++;
    *p_token         = {};
    p_token->p_start = p;
    p_token->p_end   = p;
    if (p >= p_end) {
        p_token->kind = KU_TOKEN_END;
        return 0;
    }
    if (is_digit(*p) || (*p == '.' && is_digit(p[1])))
        return read_number(p_token, p_trouble);
    if (*p == '"' || *p == '\'') {
        p_token->p_content = p + 1;
        return read_string(p_end, p_token, p_trouble);
    }
    if (*p == '$' && (p[1] == '"' || p[1] == '\'')) {
        p_token->escaped   = true;
        p_token->p_content = p + 2;
        return read_string(p_end, p_token, p_trouble);
    }
    if (!starts_name(*p))
        return read_operator(p_token, p_trouble);
    while (continues_name(*p))
        p++;
    p_token->kind  = KU_TOKEN_NAME;
    p_token->p_end = p;
    return 0;
}

size_t ku_expr_decode_string(const ku_token_t & token, char * p_to)
{
    const size_t length = static_cast<size_t>(token.p_contents_end - token.p_content);
    if (!token.escaped) {
        std::memcpy(p_to, token.p_content, length);
        return length;
    }
    size_t written = 0;
    for (const char * p = token.p_content; p < token.p_contents_end;) {
        if (*p != '\\') {
            p_to[written++] = *p++;
            continue;
        }
        p++;
        size_t count = 0;
        read_escape(p, token.p_contents_end, p_to + written, &count); // was read once before, without trouble
        written += count;
    }
    return written;
}

bool ku_token_is_word(const ku_token_t & token, const char * p_word)
{
    if (token.kind != KU_TOKEN_NAME || std::strlen(p_word) != static_cast<size_t>(token.p_end - token.p_start))
        return false;
    for (const char * p = token.p_start; p < token.p_end; p++, p_word++) {
        const char c = *p >= 'A' && *p <= 'Z' ? static_cast<char>(*p - 'A' + 'a') : *p;
        if (c != *p_word)
            return false;
    }
    return true;
}
