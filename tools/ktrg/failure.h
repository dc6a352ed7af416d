// SPDX-License-Identifier: MIT
// failure: how ktrg says no: one line on standard error that names the table, the cause and the way out, and the exit
// code that scripts test.
//
// Everything below main throws `failure`; main prints it and returns its exit code. The exit codes and the shape of the
// line are a contract with the tool's users.
#pragma once

#include <exception>
#include <string>
#include <string_view>
#include <vector>

#include "kt_types.h"

namespace ktrg
{

enum class exit_code : int {
    done          = 0,
    plain_no      = 1,
    usage         = 2,
    not_found     = 3,
    damaged       = 4,
    busy          = 5,
    conflict      = 6,
    input_output  = 7,
    not_permitted = 8,
    done_in_part  = 10,
    internal      = 70,
    interrupted   = 130
};

class failure : public std::exception
{
  public:
    // `code` is the registry's code, 0 if the tool itself refuses.
    failure(exit_code exit, std::string subject, std::string text, kt_int32_t code = 0)
        : exit_(exit), code_(code), subject_(std::move(subject)), text_(std::move(text))
    {
    }
    const char *        what() const noexcept override { return text_.c_str(); }
    exit_code           exit() const { return exit_; }
    kt_int32_t          code() const { return code_; }
    const std::string & subject() const { return subject_; }
    const std::string & text() const { return text_; }
    // Lines that follow the message as they are, such as a selection with a caret under the wrong place.
    const std::string & detail() const { return detail_; }
    failure &           with_detail(std::string detail)
    {
        detail_ = std::move(detail);
        return *this;
    }

  private:
    exit_code   exit_;
    kt_int32_t  code_;
    std::string subject_;
    std::string text_;
    std::string detail_;
};

// The failure of a registry call that returned `code`, in words of the tool where it has better ones than the error
// record. `context` goes in front of the text if it isn't empty.
[[nodiscard]] failure registry_failure(kt_int32_t code, std::string_view subject, std::string_view context = {});

// The exit code that stands for a registry code.
[[nodiscard]] exit_code exit_code_of(kt_int32_t code);

// The candidate closest to what was typed, if one is close enough to be a slip of the fingers; else empty.
[[nodiscard]] std::string closest(std::string_view typed, const std::vector<std::string> & candidates);

// ` (did you mean "name"?)`, or nothing.
[[nodiscard]] std::string did_you_mean(std::string_view typed, const std::vector<std::string> & candidates);

// `"text"`, with what can't be shown escaped.
[[nodiscard]] std::string in_quotes(std::string_view text);

// How failures are shown: as text, or one JSON object a line.
enum class error_style { text, json };

// Prints `ktrg: subject: text [code]`.
void print_failure(const failure & what, error_style style);

} // namespace ktrg
