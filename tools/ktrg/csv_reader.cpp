// SPDX-License-Identifier: MIT
// csv_reader: feeds libcsv a line at a time, since it doesn't count lines itself.
//
// libcsv's strict mode refuses a quote inside a bare field and text behind a closing quote. Spaces are part of a field,
// as RFC 4180 has it.
#include "csv_reader.h"

#include <new>

#include <csv.h>
#include <fmt/format.h>

#include "failure.h"

namespace ktrg
{

namespace
{

struct csv_builder {
    text_rows     result;
    std::uint64_t line        = 1;    // of the bytes that are being fed
    std::uint64_t record_line = 1;    // where the record under way began
    bool          between     = true; // no record is under way

    static void on_cell(void * p_text, std::size_t length, void * p_builder)
    {
        auto & self = *static_cast<csv_builder *>(p_builder);
        if (p_text != nullptr)
            self.result.add_cell(text_kind::plain, {static_cast<const char *>(p_text), length});
        else
            self.result.add_cell(text_kind::missing, {});
    }
    static void on_record(int, void * p_builder)
    {
        auto & self = *static_cast<csv_builder *>(p_builder);
        self.result.end_row(self.record_line);
        self.between = true;
    }
};

int no_space(unsigned char)
{
    return 0;
}

struct parser_owner {
    csv_parser parser{};
    parser_owner()
    {
        if (csv_init(&parser, CSV_STRICT | CSV_STRICT_FINI | CSV_EMPTY_IS_NULL) != 0)
            throw std::bad_alloc();
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

text_rows read_csv(std::string_view text, const std::string & subject, const std::string & file_name)
{
    constexpr std::string_view byte_order_mark = "\xef\xbb\xbf";
    if (text.starts_with(byte_order_mark))
        text.remove_prefix(byte_order_mark.size());

    csv_builder  builder;
    parser_owner owner;
    csv_parser & parser = owner.parser;
    const auto   refuse = [&](std::uint64_t line) {
        if (csv_error(&parser) == CSV_ENOMEM)
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

} // namespace ktrg
