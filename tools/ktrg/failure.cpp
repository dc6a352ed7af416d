// SPDX-License-Identifier: MIT
// failure: the words and exit codes of what can go wrong.
//
// The registry's own messages name its functions and lines, which helps its maintainers; the table below has words for
// people who stand before a shell. Codes that it doesn't know keep the registry's text.
#include "failure.h"

#include <algorithm>
#include <array>
#include <cstdio>

#include <fmt/format.h>

#include "json_text.h"
#include "kt_ku.h"
#include "kt_rg.h"
#include "utf8.h"

namespace ktrg
{

namespace
{

struct code_words {
    kt_int32_t   code;
    exit_code    exit;
    const char * text; // NULL: the registry's own
};

constexpr std::array code_table = {
    code_words{RG_E_SYSTEM_CALL, exit_code::input_output, nullptr},
    code_words{RG_E_LIBRARY_CALL, exit_code::usage, nullptr},
    code_words{RG_E_NO_MEMORY, exit_code::input_output, "out of memory"},
    code_words{RG_E_FILESYSTEM_FULL, exit_code::input_output, "the file system is full"},
    code_words{RG_E_TABLE_UNREADABLE, exit_code::damaged, "the file is damaged, or not a table"},
    code_words{RG_E_INTERNAL, exit_code::internal, nullptr},
    code_words{RG_E_FILESYSTEM_FULL_DETAIL, exit_code::input_output, nullptr},
    code_words{RG_E_INVALID_HANDLE, exit_code::internal, nullptr},
    code_words{RG_E_NULL_POINTER, exit_code::internal, nullptr},
    code_words{RG_E_INVALID_PATH, exit_code::usage, "no table can have this name"},
    code_words{RG_E_INVALID_MODE, exit_code::internal, nullptr},
    code_words{RG_E_NO_COLUMNS, exit_code::usage, "a column is unknown or named twice"},
    code_words{RG_E_INVALID_COLUMN, exit_code::usage, "a column is unknown, or its definition is not valid"},
    code_words{RG_E_DUPLICATE_COLUMN, exit_code::usage, "two columns have the same name"},
    code_words{RG_E_KEY_EXPECTED, exit_code::usage, "the key is missing"},
    code_words{RG_E_DUPLICATE_KEY, exit_code::conflict, "a row with this key exists"},
    code_words{RG_E_INVALID_VARIABLE_TYPE, exit_code::usage, nullptr},
    code_words{RG_E_NO_SUCH_TABLE, exit_code::not_found, "no such table"},
    code_words{RG_E_TABLE_EXISTS, exit_code::conflict, "the table exists"},
    code_words{RG_E_NO_SUCH_KEY, exit_code::plain_no, "no row with this key"},
    code_words{RG_E_NO_SUCH_INDEX, exit_code::plain_no, "no such row"},
    code_words{RG_E_ROW_DELETED, exit_code::plain_no, "the row is deleted"},
    code_words{RG_E_NO_ROWS_TO_DELETE, exit_code::plain_no, "no row matches"},
    code_words{RG_E_ACCESS, exit_code::not_permitted, "permission denied"},
    code_words{RG_E_MOUNT_POINT_EXISTS, exit_code::internal, nullptr},
    code_words{RG_E_NO_SUCH_MOUNT_POINT, exit_code::internal, nullptr},
    code_words{RG_E_UNCOMMITTED_TABLE, exit_code::internal, nullptr},
    code_words{RG_E_UNAPPLIED_TABLE, exit_code::internal, nullptr},
    code_words{RG_E_EXCLUSIVE_OPEN, exit_code::internal, nullptr},
    code_words{RG_E_APPLIED_UNCOMMITTED, exit_code::internal, nullptr},
    code_words{RG_E_BAD_REPLACES_OFFSET, exit_code::damaged,
               "the file is damaged: a row replaces one that isn't there"},
    code_words{RG_E_BAD_DELETED_ROW_OFFSET, exit_code::damaged,
               "the file is damaged: a deletion names a row that isn't there"},
    code_words{RG_E_NO_COMMIT_RECORD, exit_code::damaged,
               "the file is damaged, or not a table: it has no commit record"},
};

const code_words * find_words(kt_int32_t code)
{
    const auto found = std::find_if(code_table.begin(), code_table.end(),
                                    [code](const code_words & words) { return words.code == code; });
    return found == code_table.end() ? nullptr : &*found;
}

// The text of the error record without its number and its newline.
std::string recorded_text(kt_int32_t code)
{
    ku_error_record_t record{};
    ku_get_error_record_1(&record);
    if (record.code != code || record.p_text == nullptr || *record.p_text == '\0')
        return fmt::format("the registry answers with code {}", code);
    std::string_view text = record.p_text;
    while (text.ends_with('\n') || text.ends_with('.'))
        text.remove_suffix(1);
    if (text.starts_with("2605-") && text.find(' ') != std::string_view::npos)
        text.remove_prefix(text.find(' ') + 1);
    return std::string(text);
}

// Edit distance, where two neighbours exchanged count as one edit.
std::size_t distance(std::string_view a, std::string_view b)
{
    std::vector<std::vector<std::size_t>> d(a.size() + 1, std::vector<std::size_t>(b.size() + 1));
    for (std::size_t i = 0; i <= a.size(); i++)
        d[i][0] = i;
    for (std::size_t j = 0; j <= b.size(); j++)
        d[0][j] = j;
    for (std::size_t i = 1; i <= a.size(); i++) {
        for (std::size_t j = 1; j <= b.size(); j++) {
            const std::size_t change = a[i - 1] == b[j - 1] ? 0 : 1;
            d[i][j]                  = std::min({d[i - 1][j] + 1, d[i][j - 1] + 1, d[i - 1][j - 1] + change});
            if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1])
                d[i][j] = std::min(d[i][j], d[i - 2][j - 2] + 1);
        }
    }
    return d[a.size()][b.size()];
}

std::string lower(std::string_view text)
{
    std::string result(text);
    for (char & c : result)
        if (c >= 'A' && c <= 'Z')
            c = static_cast<char>(c - 'A' + 'a');
    return result;
}

} // namespace

exit_code exit_code_of(kt_int32_t code)
{
    const code_words * p_words = find_words(code);
    return p_words != nullptr ? p_words->exit : exit_code::internal;
}

failure registry_failure(kt_int32_t code, std::string_view subject, std::string_view context)
{
    const code_words * p_words = find_words(code);
    std::string        text =
        p_words != nullptr && p_words->text != nullptr ? std::string(p_words->text) : recorded_text(code);
    if (!context.empty())
        text = fmt::format("{}: {}", context, text);
    return failure(exit_code_of(code), std::string(subject), std::move(text), code);
}

std::string closest(std::string_view typed, const std::vector<std::string> & candidates)
{
    constexpr std::size_t longest_compared = 64;
    if (typed.empty() || typed.size() > longest_compared)
        return {};
    const std::string wanted = lower(typed);
    std::string       best;
    std::size_t       best_distance = 1 + std::max<std::size_t>(1, wanted.size() / 3);
    for (const std::string & candidate : candidates) {
        if (candidate.size() > longest_compared)
            continue;
        const std::size_t this_distance = distance(wanted, lower(candidate));
        if (this_distance < best_distance) {
            best_distance = this_distance;
            best          = candidate;
        }
    }
    return best;
}

std::string did_you_mean(std::string_view typed, const std::vector<std::string> & candidates)
{
    const std::string best = closest(typed, candidates);
    return best.empty() ? std::string() : fmt::format(" (did you mean \"{}\"?)", best);
}

std::string in_quotes(std::string_view text)
{
    constexpr std::size_t longest_shown = 60;
    std::string           shown         = escaped_for_display(text.substr(0, longest_shown));
    return text.size() > longest_shown ? fmt::format("\"{}...\"", shown) : fmt::format("\"{}\"", shown);
}

void print_failure(const failure & what, error_style style)
{
    if (style == error_style::json) {
        std::string line = "{\"table\":";
        append_json_string(line, what.subject());
        line += ",\"message\":";
        append_json_string(line, what.text());
        if (what.code() != 0)
            line += fmt::format(",\"code\":{}", what.code());
        if (!what.detail().empty()) {
            line += ",\"detail\":";
            append_json_string(line, what.detail());
        }
        line += fmt::format(",\"exit\":{}}}\n", static_cast<int>(what.exit()));
        std::fputs(line.c_str(), stderr);
        return;
    }
    std::string line = "ktrg: ";
    if (!what.subject().empty())
        line += escaped_for_display(what.subject()) + ": ";
    line += escaped_for_display(what.text());
    if (what.code() != 0)
        line += fmt::format(" [{}]", what.code());
    line += '\n';
    line += what.detail();
    std::fputs(line.c_str(), stderr);
}

} // namespace ktrg
