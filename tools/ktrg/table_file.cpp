// SPDX-License-Identifier: MIT
// table_file: reads the records of a table's file.
//
// Always holds: every offset is compared with the file's length before it is used, sums are made in 64 bits, and each
// step of the walk moves forward by at least a record header, so that the walk ends whatever the bytes are. A file that
// a writer changes meanwhile is read like any other reader reads it: up to the first live commit record.
#include "table_file.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include "failure.h"
#include "json_text.h"
#include "talk.h"
#include "values.h"

namespace ktrg
{

namespace
{

constexpr std::uint32_t type_superseded = 0;
constexpr std::uint32_t type_metadata   = 1;
constexpr std::uint32_t type_row        = 2;
constexpr std::uint32_t type_deletions  = 3;
constexpr std::uint32_t type_commit     = 0xFFFFFFFF;

constexpr std::uint64_t header_length        = 12;
constexpr std::uint64_t metadata_head_length = 28; // the header, and four words
constexpr std::uint64_t column_length        = 28;

// A file open for reading, through a window that moves with the walk.
class file_window
{
  public:
    file_window(const std::string & path, const std::string & name) : name_(name)
    {
        fd_ = open(path.c_str(), O_RDONLY | O_CLOEXEC);
        if (fd_ < 0)
            refuse_open(errno);
        struct stat status {
        };
        if (fstat(fd_, &status) != 0 || !S_ISREG(status.st_mode)) {
            close(fd_);
            throw failure(exit_code::usage, name_, "not a table, for it isn't a regular file");
        }
        length_  = static_cast<std::uint64_t>(status.st_size);
        changed_ = status.st_mtim;
    }
    ~file_window() { close(fd_); }
    file_window(const file_window &)             = delete;
    file_window & operator=(const file_window &) = delete;

    [[nodiscard]] std::uint64_t length() const { return length_; }
    [[nodiscard]] std::timespec changed() const { return changed_; }

    // The bytes at an offset, which stay where they are until the next call. Refuses what leaves the file.
    const unsigned char * bytes(std::uint64_t offset, std::uint64_t count)
    {
        if (offset > length_ || count > length_ - offset)
            throw damaged("a record leaves the file", offset);
        if (offset < start_ || offset + count > start_ + filled_)
            fill(offset, count);
        return window_.data() + (offset - start_);
    }

    std::uint32_t word(std::uint64_t offset)
    {
        std::uint32_t value = 0;
        std::memcpy(&value, bytes(offset, sizeof value), sizeof value);
        return value;
    }

    [[nodiscard]] failure damaged(const char * p_what, std::uint64_t offset,
                                  kt_int32_t code = RG_E_TABLE_UNREADABLE) const
    {
        return failure(exit_code::damaged, name_,
                       fmt::format("the file is damaged, or not a table: {} at byte {}", p_what, offset), code);
    }

  private:
    [[noreturn]] void refuse_open(int the_errno) const
    {
        if (the_errno == ENOENT || the_errno == ENOTDIR)
            throw registry_failure(RG_E_NO_SUCH_TABLE, name_);
        if (the_errno == EACCES || the_errno == EPERM)
            throw registry_failure(RG_E_ACCESS, name_);
        throw failure(exit_code::input_output, name_, std::strerror(the_errno), RG_E_SYSTEM_CALL);
    }

    void fill(std::uint64_t offset, std::uint64_t count)
    {
        constexpr std::uint64_t usual = 1U << 20;
        window_.resize(std::min(std::max(count, usual), length_ - offset));
        start_  = offset;
        filled_ = 0;
        while (filled_ < window_.size()) {
            const ssize_t got =
                pread(fd_, window_.data() + filled_, window_.size() - filled_, static_cast<off_t>(offset + filled_));
            if (got < 0 && errno == EINTR)
                continue;
            if (got < 0)
                throw failure(exit_code::input_output, name_, std::strerror(errno), RG_E_SYSTEM_CALL);
            if (got == 0)
                break;
            filled_ += static_cast<std::uint64_t>(got);
        }
        if (filled_ < count)
            throw damaged("the file became shorter", offset);
    }

    int                        fd_ = -1;
    std::string                name_;
    std::uint64_t              length_  = 0;
    std::timespec              changed_ = {};
    std::uint64_t              start_   = 0;
    std::uint64_t              filled_  = 0;
    std::vector<unsigned char> window_;
};

// ---- The metadata record ----

struct metadata_record {
    std::vector<unsigned char> image;
    std::uint32_t              total_columns = 0;
    std::uint64_t              region        = 0; // where the variable data starts
};

std::uint32_t word_at(const std::vector<unsigned char> & image, std::uint64_t offset)
{
    std::uint32_t value = 0;
    std::memcpy(&value, image.data() + offset, sizeof value);
    return value;
}

metadata_record read_metadata(file_window & file)
{
    if (file.length() <= header_length)
        throw file.damaged("it is too short", 0);
    metadata_record     record;
    const std::uint64_t length = file.word(0);
    if (file.word(8) != type_metadata || length < metadata_head_length)
        throw file.damaged("there is no metadata record", 0);
    const unsigned char * p_bytes = file.bytes(0, length);
    record.image.assign(p_bytes, p_bytes + length);
    record.total_columns = word_at(record.image, 20);
    record.region        = metadata_head_length + column_length * record.total_columns;
    if (record.total_columns == 0 || record.region > length)
        throw file.damaged("the columns leave the metadata record", 0);
    return record;
}

// The terminated text at an offset of the variable data.
std::string region_text(const file_window & file, const metadata_record & record, std::uint64_t offset)
{
    const std::uint64_t start = record.region + offset;
    if (start >= record.image.size())
        throw file.damaged("a name leaves the metadata record", start);
    const auto *      p_start = reinterpret_cast<const char *>(record.image.data() + start);
    const std::size_t room    = record.image.size() - start;
    const std::size_t length  = strnlen(p_start, room);
    if (length == room)
        throw file.damaged("a name leaves the metadata record", start);
    return std::string(p_start, length);
}

std::vector<column_field> read_fields(const file_window & file, const metadata_record & record, std::uint64_t offset)
{
    std::vector<column_field> fields;
    if (record.region + offset + 4 > record.image.size())
        throw file.damaged("a structure's definition leaves the metadata record", record.region + offset);
    const std::uint32_t count = word_at(record.image, record.region + offset);
    offset += 4;
    for (std::uint32_t i = 0; i < count; i++) {
        if (record.region + offset + 4 > record.image.size())
            throw file.damaged("a structure's definition leaves the metadata record", record.region + offset);
        column_field field;
        field.type = word_at(record.image, record.region + offset);
        field.name = region_text(file, record, offset + 4);
        offset += 4 + field.name.size() + 1;
        fields.push_back(std::move(field));
    }
    return fields;
}

// The default as text: of numbers, strings and handles, which lie in the record as they are in memory.
std::string read_default(const file_window & file, const metadata_record & record, const column & of,
                         std::uint64_t slot)
{
    kt_value_t value{};
    if (!is_indirect(of.type)) {
        std::memcpy(&value, record.image.data() + slot, sizeof value);
        return default_text_of(of, value);
    }
    const std::uint64_t offset = word_at(record.image, slot);
    const std::uint64_t length = word_at(record.image, slot + 4);
    if (record.region + offset + length > record.image.size())
        throw file.damaged("a default leaves the metadata record", slot);
    const unsigned char * p_data = record.image.data() + record.region + offset;
    if (of.type == KT_CHAR_PTR) {
        std::string text(reinterpret_cast<const char *>(p_data),
                         strnlen(reinterpret_cast<const char *>(p_data), length));
        value.ptr_char = text.data();
        return default_text_of(of, value);
    }
    if (of.type == KT_RSRC_HANDLE_PTR && length == sizeof(kt_resource_handle_t)) {
        kt_resource_handle_t handle{};
        std::memcpy(&handle, p_data, sizeof handle);
        value.ptr_rsrc_handle = &handle;
        return default_text_of(of, value);
    }
    return {};
}

std::vector<column> columns_of(const file_window & file, const metadata_record & record)
{
    std::vector<column> columns(record.total_columns);
    for (std::uint32_t i = 0; i < record.total_columns; i++) {
        const std::uint64_t at        = metadata_head_length + column_length * i;
        column &            each      = columns[i];
        const std::uint32_t sd_offset = word_at(record.image, at + 16);
        each.name                     = region_text(file, record, word_at(record.image, at));
        each.type                     = word_at(record.image, at + 4);
        each.qualifier                = word_at(record.image, at + 8);
        each.properties               = static_cast<kt_int32_t>(word_at(record.image, at + 12));
        if (each.type < KT_INT32 || each.type > KT_SD_PTR_ARRAY)
            throw file.damaged("a column has a type that doesn't exist", at + 4);
        if (sd_offset != 0)
            each.fields = read_fields(file, record, sd_offset);
        each.default_text = read_default(file, record, each, at + 20);
    }
    return columns;
}

// ---- The walk ----

struct row_record {
    std::uint32_t offset;
    std::uint32_t length;
};

class walk
{
  public:
    walk(file_window & file, table_file & result) : file_(file), result_(result) {}

    void run(std::uint64_t offset)
    {
        for (;;) {
            // The file may end here for this reader while a writer goes on: then the caller reads again.
            if (file_.length() - offset < header_length)
                throw file_.damaged("it has no commit record up to its end", offset, RG_E_NO_COMMIT_RECORD);
            const std::uint64_t length = file_.word(offset);
            const std::uint32_t type   = file_.word(offset + 8);
            if (length < header_length || length > file_.length() - offset)
                throw file_.damaged("a record has an impossible length", offset,
                                    length < header_length ? RG_E_TABLE_UNREADABLE : RG_E_NO_COMMIT_RECORD);
            if (type == type_commit) {
                take_live_commit(offset, length);
                return;
            }
            take_record(offset, length, type);
            offset += length;
        }
    }

  private:
    void take_record(std::uint64_t offset, std::uint64_t length, std::uint32_t type)
    {
        if (type == type_superseded) {
            result_.bytes.superseded_commits += length;
            result_.transactions++;
        } else if (type == type_row) {
            take_row(offset, length);
        } else if (type == type_deletions) {
            take_deletions(offset, length);
        } else {
            throw file_.damaged("a record has a type that doesn't exist", offset);
        }
    }

    void take_live_commit(std::uint64_t offset, std::uint64_t length)
    {
        constexpr std::uint64_t without_blob = 24;
        if (length < without_blob)
            throw file_.damaged("the commit record is too short", offset);
        std::memcpy(&result_.counter, file_.bytes(offset + 16, 8), 8);
        take_blob(offset, length);
        result_.bytes.live_commit   = length;
        result_.bytes.behind_commit = file_.length() - offset - length;
        result_.transactions++;
    }

    // The commit record repeats the application's elements; the blob is the one of type 0.
    void take_blob(std::uint64_t offset, std::uint64_t length)
    {
        if (length < 28)
            return;
        const std::uint32_t count = file_.word(offset + 24);
        std::uint64_t       at    = offset + 28;
        for (std::uint32_t i = 0; i < count && at + 8 <= offset + length; i++) {
            if (file_.word(at) == 0) {
                result_.has_blob    = true;
                result_.blob_length = file_.word(at + 4);
            }
            at += 8 + std::uint64_t{file_.word(at + 4)};
        }
    }

    void take_row(std::uint64_t offset, std::uint64_t length)
    {
        if (length < 16 + 8 * result_.columns.size())
            throw file_.damaged("a row is shorter than its columns", offset);
        const std::uint32_t replaced = file_.word(offset + 12);
        rows_.push_back({static_cast<std::uint32_t>(offset), static_cast<std::uint32_t>(length)});
        result_.bytes.live_rows += length;
        if (replaced == 0) {
            result_.rows++;
            return;
        }
        result_.updates++;
        const std::uint64_t old_length = retire(replaced, offset, RG_E_BAD_REPLACES_OFFSET);
        result_.bytes.superseded_rows += old_length;
    }

    void take_deletions(std::uint64_t offset, std::uint64_t length)
    {
        const std::uint64_t count = length < 16 ? 0 : file_.word(offset + 12);
        if (length < 16 || count > (length - 16) / 4)
            throw file_.damaged("a deletion list is too short", offset);
        for (std::uint64_t i = 0; i < count; i++) {
            const std::uint64_t old_length =
                retire(file_.word(offset + 16 + 4 * i), offset, RG_E_BAD_DELETED_ROW_OFFSET);
            result_.bytes.deleted_rows += old_length;
            result_.deletions++;
            if (old_length != 0)
                result_.rows--;
        }
        result_.bytes.deletion_lists += length;
    }

    // Takes a row record out of the live ones. Its length, or 0 if it is retired already.
    std::uint64_t retire(std::uint32_t target, std::uint64_t offset, kt_int32_t code)
    {
        const auto found = std::lower_bound(rows_.begin(), rows_.end(), target,
                                            [](const row_record & row, std::uint32_t at) { return row.offset < at; });
        if (found == rows_.end() || found->offset != target || target == offset)
            throw file_.damaged(code == RG_E_BAD_REPLACES_OFFSET ? "a row replaces one that isn't there"
                                                                 : "a deletion names a row that isn't there",
                                offset, code);
        const std::uint64_t length = found->length;
        found->length              = 0;
        result_.bytes.live_rows -= length;
        return length;
    }

    file_window &           file_;
    table_file &            result_;
    std::vector<row_record> rows_; // in ascending order of their offsets, as the walk meets them
};

table_file read_once(const std::string & path, const std::string & name)
{
    file_window           file(path, name);
    table_file            result;
    const metadata_record record = read_metadata(file);
    result.columns               = columns_of(file, record);
    result.length                = file.length();
    result.changed               = file.changed();
    result.big_endian            = word_at(record.image, 12) != 0;
    result.bytes.metadata        = record.image.size();
    walk(file, result).run(record.image.size());
    return result;
}

} // namespace

std::vector<column> read_table_columns(const std::string & path, const std::string & name)
{
    file_window file(path, name);
    return columns_of(file, read_metadata(file));
}

table_file read_table_file(const std::string & path, const std::string & name)
{
    // A commit that happens while the walk is under way can lead it beyond the length that it began with. The next
    // attempt begins with the new one.
    constexpr int   attempts = 3;
    const stopwatch time;
    for (int attempt = 1;; attempt++) {
        try {
            table_file result = read_once(path, name);
            tell(fmt::format("{}: read record by record: {}, {}, {} bytes, counter {}, {}", name,
                             counted(result.rows, "row"), counted(result.columns.size(), "column"), result.length,
                             result.counter, time.text()));
            return result;
        } catch (const failure & what) {
            if (what.code() != RG_E_NO_COMMIT_RECORD || attempt == attempts)
                throw;
        }
    }
}

bool looks_like_table(const std::string & path)
{
    std::array<std::uint32_t, 7> head{};
    const int                    fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0)
        return errno == EACCES;
    struct stat status {
    };
    const bool regular = fstat(fd, &status) == 0 && S_ISREG(status.st_mode);
    const bool whole   = regular && read(fd, head.data(), sizeof head) == static_cast<ssize_t>(sizeof head);
    close(fd);
    return whole && head[2] == type_metadata && head[0] >= metadata_head_length && head[3] <= 1 && head[4] == 0;
}

} // namespace ktrg
