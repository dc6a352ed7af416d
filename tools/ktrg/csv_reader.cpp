// SPDX-License-Identifier: MIT
// csv_reader: feeds libcsv a line at a time, since it doesn't count lines itself.
//
// libcsv's strict mode refuses a quote inside a bare field and text behind a closing quote. Spaces are part of a field,
// as RFC 4180 has it.
#include "csv_reader.h"

#include <cerrno>
#include <cstring>

#include <csv.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include "failure.h"
#include "interrupt.h"

namespace ktrg
{

struct csv_builder {
    csv_text      result;
    std::uint64_t line        = 1;    // of the bytes that are being fed
    std::uint64_t record_line = 1;    // where the record under way began
    std::size_t   first_cell  = 0;    // of the record under way
    bool          between     = true; // no record is under way

    static void on_cell(void * p_text, std::size_t length, void * p_builder)
    {
        auto & self = *static_cast<csv_builder *>(p_builder);
        if (p_text != nullptr)
            self.result.text_.append(static_cast<const char *>(p_text), length);
        self.result.ends_.push_back(self.result.text_.size());
        self.result.missing_.push_back(p_text == nullptr);
    }
    static void on_record(int, void * p_builder)
    {
        auto & self = *static_cast<csv_builder *>(p_builder);
        self.result.records_.push_back({self.record_line, self.first_cell});
        self.first_cell = self.result.ends_.size();
        self.between    = true;
    }
};

namespace
{

int no_space(unsigned char)
{
    return 0;
}

struct parser_owner {
    csv_parser parser{};
    explicit parser_owner(char separator)
    {
        if (csv_init(&parser, CSV_STRICT | CSV_STRICT_FINI | CSV_EMPTY_IS_NULL) != 0)
            throw std::bad_alloc();
        csv_set_delim(&parser, static_cast<unsigned char>(separator));
        csv_set_space_func(&parser, no_space);
    }
    ~parser_owner() { csv_free(&parser); }
    parser_owner(const parser_owner &)             = delete;
    parser_owner & operator=(const parser_owner &) = delete;
};

// The text up to and with its first line end: LF, CRLF or CR.
std::string_view first_line(std::string_view text)
{
    std::size_t end = text.find_first_of("\r\n");
    if (end == std::string_view::npos)
        return text;
    if (text[end] == '\r' && end + 1 < text.size() && text[end + 1] == '\n')
        end++;
    return text.substr(0, end + 1);
}

bool is_blank(std::string_view line)
{
    return line.find_first_not_of("\r\n") == std::string_view::npos;
}

} // namespace

csv_text csv_text::parse(std::string_view text, char separator, const std::string & subject,
                         const std::string & file_name)
{
    constexpr std::string_view byte_order_mark = "\xef\xbb\xbf";
    if (text.starts_with(byte_order_mark))
        text.remove_prefix(byte_order_mark.size());

    csv_builder  builder;
    parser_owner owner(separator);
    csv_parser & parser = owner.parser;
    const auto   refuse = [&](std::uint64_t line) {
        const int error = csv_error(&parser);
        if (error == CSV_ENOMEM)
            throw std::bad_alloc();
        throw failure(
              exit_code::usage, subject,
              fmt::format("{}:{}: not CSV: a quote stands in the middle of a field, or none closes it", file_name, line));
    };
    while (!text.empty()) {
        const std::string_view line = first_line(text);
        if (builder.between) {
            builder.record_line = builder.line;
            builder.between     = is_blank(line);
        }
        if (csv_parse(&parser, line.data(), line.size(), csv_builder::on_cell, csv_builder::on_record, &builder) !=
            line.size())
            refuse(builder.line);
        text.remove_prefix(line.size());
        builder.line++;
    }
    if (csv_fini(&parser, csv_builder::on_cell, csv_builder::on_record, &builder) != 0)
        refuse(builder.record_line);
    return std::move(builder.result);
}

std::size_t csv_text::cells_of(std::size_t record) const
{
    const std::size_t end = record + 1 < records_.size() ? records_[record + 1].first_cell : ends_.size();
    return end - records_[record].first_cell;
}

csv_text::csv_cell csv_text::at(std::size_t record, std::size_t i) const
{
    const std::size_t position = records_[record].first_cell + i;
    const std::size_t start    = position == 0 ? 0 : ends_[position - 1];
    return {std::string_view(text_).substr(start, ends_[position] - start), missing_[position]};
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
