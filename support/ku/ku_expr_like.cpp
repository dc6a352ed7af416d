// SPDX-License-Identifier: MIT
// ku_expr_like: patterns with % (any characters), _ (one character) and \ (the next character as it is).
//
// A character is one of UTF-8; a byte that isn't part of a well-formed one counts as a character. A backslash that ends
// the pattern stands for itself.
// Always holds: once a % is reached, what an earlier % covers is settled. So a match costs at most the text's length
// times the pattern's, whatever they are.
#include "ku_expr.h"
#include "ku_utf8.h"

#include <cstring>

namespace
{

constexpr size_t nowhere = SIZE_MAX;

// One position in the text and one in the pattern, moved together.
class matcher
{
  public:
    matcher(const ku_text_t & text, const ku_text_t & pattern)
        : p_text_(text.p), p_text_end_(text.p + text.length), p_pattern_(pattern.p), pattern_length_(pattern.length),
          text_shown_(ku_letter_tables.shown[text.letters]), pattern_shown_(ku_letter_tables.shown[pattern.letters])
    {
    }

    bool run()
    {
        const uint8_t * p_retry_text  = nullptr; // where the last % ends for now
        size_t          retry_pattern = nowhere; // behind the last %
        while (p_text_ < p_text_end_) {
            if (at_ < pattern_length_ && p_pattern_[at_] == '%') {
                p_retry_text  = p_text_;
                retry_pattern = ++at_;
            } else if (at_ < pattern_length_ && take_one()) {
                continue;
            } else if (retry_pattern != nowhere) {
                p_retry_text = next_candidate(p_retry_text, retry_pattern);
                p_text_      = p_retry_text;
                at_          = retry_pattern;
            } else {
                return false;
            }
        }
        while (at_ < pattern_length_ && p_pattern_[at_] == '%')
            at_++;
        return at_ == pattern_length_;
    }

  private:
    // Matches one byte, or one character for a _, and moves on.
    bool take_one()
    {
        if (p_pattern_[at_] == '_') {
            p_text_ += ku_utf8_step(p_text_, p_text_end_);
            at_++;
            return true;
        }
        const size_t literal = at_ + (p_pattern_[at_] == '\\' && at_ + 1 < pattern_length_ ? 1 : 0);
        if (text_shown_[*p_text_] != pattern_shown_[p_pattern_[literal]])
            return false;
        p_text_++;
        at_ = literal + 1;
        return true;
    }

    // The % takes one character more, or as many as lead to the byte that must follow it.
    const uint8_t * next_candidate(const uint8_t * p, size_t behind_percent) const
    {
        p += ku_utf8_step(p, p_text_end_);
        if (text_shown_ != pattern_shown_ || text_shown_ != ku_letter_tables.shown[KU_LETTERS_AS_THEY_ARE])
            return p;
        const uint8_t first = behind_percent < pattern_length_ ? p_pattern_[behind_percent] : '%';
        // Bytes of 0x80 and above could also stand in the middle of a character.
        if (first == '%' || first == '_' || first == '\\' || first >= 0x80 || p >= p_text_end_)
            return p;
        const void * p_found = std::memchr(p, first, static_cast<size_t>(p_text_end_ - p));
        return p_found != nullptr ? static_cast<const uint8_t *>(p_found) : p_text_end_;
    }

    const uint8_t *       p_text_;
    const uint8_t * const p_text_end_;
    const uint8_t * const p_pattern_;
    const size_t          pattern_length_;
    const uint8_t * const text_shown_;
    const uint8_t * const pattern_shown_;
    size_t                at_ = 0; // in the pattern
};

} // namespace

bool ku_like_matches(const ku_text_t & text, const ku_text_t & pattern)
{
    return matcher(text, pattern).run();
}

ku_like_class_t ku_like_classify(const uint8_t * p_pattern, size_t length, uint8_t * p_literal,
                                 size_t * p_literal_length)
{
    size_t at = 0;
    while (at < length && p_pattern[at] == '%')
        at++;
    const bool open_start = at != 0;
    size_t     copied     = 0;
    for (; at < length && p_pattern[at] != '%'; at++) {
        if (p_pattern[at] == '_')
            return KU_LIKE_GENERAL;
        if (p_pattern[at] == '\\' && at + 1 < length)
            at++;
        p_literal[copied++] = p_pattern[at];
    }
    const bool open_end = at < length || (open_start && copied == 0);
    while (at < length && p_pattern[at] == '%')
        at++;
    if (at != length)
        return KU_LIKE_GENERAL;
    *p_literal_length = copied;
    if (open_start)
        return open_end ? KU_LIKE_CONTAINS : KU_LIKE_ENDS;
    return open_end ? KU_LIKE_STARTS : KU_LIKE_EQUALS;
}
