// SPDX-License-Identifier: MIT
// text_rows: see its header.
#include "text_rows.h"

#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include "failure.h"
#include "interrupt.h"
#include "talk.h"

namespace ktrg
{

void text_rows::add_cell(text_kind kind, std::string_view text)
{
    text_ += text;
    ends_.push_back(text_.size());
    kinds_.push_back(kind);
}

void text_rows::end_row(std::uint64_t line)
{
    rows_.push_back({line, first_cell_});
    first_cell_ = ends_.size();
}

std::size_t text_rows::cells_of(std::size_t row) const
{
    const std::size_t end = row + 1 < rows_.size() ? rows_[row + 1].first_cell : first_cell_;
    return end - rows_[row].first_cell;
}

text_cell text_rows::at(std::size_t row, std::size_t i) const
{
    if (i >= cells_of(row))
        return {};
    const std::size_t position = rows_[row].first_cell + i;
    const std::size_t start    = position == 0 ? 0 : ends_[position - 1];
    return {kinds_[position], std::string_view(text_).substr(start, ends_[position] - start)};
}

std::string read_whole(const std::string & file_name, const std::string & subject)
{
    const bool is_input = file_name == "-";
    const int  fd       = is_input ? STDIN_FILENO : open(file_name.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        throw failure(errno == ENOENT   ? exit_code::not_found
                      : errno == EACCES ? exit_code::not_permitted
                                        : exit_code::input_output,
                      subject, fmt::format("{}: {}", file_name, std::strerror(errno)));
    std::string           text;
    constexpr std::size_t step  = 1U << 18;
    std::size_t           total = 0;
    for (;;) {
        text.resize(total + step);
        const ssize_t got   = read(fd, text.data() + total, step);
        const int     error = errno;
        if (got < 0 && error == EINTR && !interrupted())
            continue;
        if (got <= 0 && !is_input)
            close(fd);
        stop_if_interrupted();
        if (got < 0)
            throw failure(exit_code::input_output, subject, fmt::format("{}: {}", file_name, std::strerror(error)));
        if (got == 0)
            break;
        total += static_cast<std::size_t>(got);
    }
    text.resize(total);
    return text;
}

} // namespace ktrg
