// SPDX-License-Identifier: MIT
// table_files: what the tests of the storage stand on: table files built record by record, the state that a file or a
// handle shows, and the states that a crash could leave.
#pragma once

#include <dirent.h>
#include <unistd.h>

#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "kt_tr.h"
#include "rg_i_table.h"
#include "support/faults.h"
#include "support/registry.h"

namespace kt_test
{

inline std::vector<rg_column_t> example_columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("val", KT_INT64)};
}

inline rg_i_table_t & object(rg_opaque_handle_t table)
{
    return *static_cast<rg_i_table_t *>(table);
}

// A directory, and a tree that has it at "/r". The table file of "/r/t" is path.
struct registry_at {
    temp_dir    dir;
    open_tree   tree;
    std::string path    = dir.file("t");
    std::string rewrite = dir.file("t.rewrite");

    registry_at() { tree.mount("/r", dir.path()); }
    rg_opaque_handle_t create(kt_int32_t mode = RG_MODE_WRITE)
    {
        return create_table(tree, "/r/t", example_columns(), mode);
    }
    rg_opaque_handle_t open(kt_int32_t mode, kt_int32_t * p_rc = nullptr)
    {
        return open_table(tree, "/r/t", mode, p_rc);
    }
    kt_int32_t try_open(kt_int32_t mode = RG_MODE_READ)
    {
        kt_int32_t         rc    = 0;
        rg_opaque_handle_t table = open_table(tree, "/r/t", mode, &rc);
        if (table != nullptr) {
            EXPECT_EQ(rg_close_table_1(table), 0);
        }
        return rc;
    }
};

inline kt_int32_t add(rg_opaque_handle_t table, std::uint32_t id, std::int64_t val)
{
    return add_row(table, {{"id", uint32(id)}, {"val", int64(val)}});
}

inline kt_int32_t set(rg_opaque_handle_t table, std::uint32_t id, std::int64_t val)
{
    kt_value_t value = int64(val);
    return rg_set_field_by_key_1(table, uint32(id), text("val"), &value);
}

// Deletes the row with the key, which must be there, by its packed index.
inline kt_int32_t remove(rg_opaque_handle_t table, std::uint32_t id)
{
    kt_uint32_t fixed = 0;
    EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, uint32(id), &fixed), 0);
    return rg_delete_row_by_index_1(table, object(table).p_rows_fixed_index[fixed].packed_index);
}

// Id and value of all rows that a handle shows, in packed order.
using rows = std::vector<std::pair<std::uint32_t, std::int64_t>>;

inline rows rows_of(rg_opaque_handle_t table)
{
    rows result;
    for (kt_int32_t i = 0; i < static_cast<kt_int32_t>(object(table).total_applied_rows); ++i) {
        kt_value_t id, val;
        EXPECT_EQ(rg_get_field_by_index_1(table, i, text("id"), &id), 0) << i;
        EXPECT_EQ(rg_get_field_by_index_1(table, i, text("val"), &val), 0) << i;
        result.emplace_back(id.val_uint32, val.val_int64);
    }
    return result;
}

// What a reader finds in a file: the code of the open, and if it is 0 the rows by id, and the change counter.
struct file_state {
    kt_int32_t                            rc             = 0;
    std::uint64_t                         change_counter = 0;
    std::map<std::uint32_t, std::int64_t> rows;

    friend bool           operator==(const file_state &, const file_state &) = default;
    friend std::ostream & operator<<(std::ostream & out, const file_state & state)
    {
        out << "code " << state.rc << " counter " << state.change_counter;
        for (const auto & [id, val] : state.rows)
            out << " (" << id << ", " << val << ")";
        return out;
    }
};

// Reads the table file "t" of the directory, with a tree of its own.
inline file_state state_in(const std::string & directory)
{
    open_tree tree;
    tree.mount("/r", directory);
    file_state         state;
    rg_opaque_handle_t table = open_table(tree, "/r/t", RG_MODE_READ, &state.rc);
    if (table == nullptr)
        return state;
    state.change_counter = object(table).change_counter;
    for (const auto & [id, val] : rows_of(table))
        state.rows[id] = val;
    EXPECT_EQ(rg_close_table_1(table), 0);
    return state;
}

inline file_state state_of_bytes(const bytes & content)
{
    temp_dir dir;
    write_file(dir.file("t"), content);
    return state_in(dir.path());
}

// ---- Files built by hand ----

// Table files of the two example columns, as their writer would have made them or not.
class file_image
{
  public:
    file_image() { metadata(); }
    explicit file_image(bytes content) : content_(std::move(content)) {}

    std::uint32_t size() const { return static_cast<std::uint32_t>(content_.size()); }
    const bytes & content() const { return content_; }
    file_state    state() const { return state_of_bytes(content_); }

    // Each adds a record and gives its offset.
    std::uint32_t record(std::uint32_t type, const bytes & payload, std::optional<std::uint32_t> length = {})
    {
        const std::uint32_t offset = size();
        word(length.value_or(12 + static_cast<std::uint32_t>(payload.size())));
        word(0);
        word(type);
        content_.insert(content_.end(), payload.begin(), payload.end());
        return offset;
    }
    std::uint32_t row(std::uint32_t replaces, std::uint64_t id, std::int64_t val)
    {
        return record(2, file_image(bytes{}).word(replaces).wide(id).wide(static_cast<std::uint64_t>(val)).content_);
    }
    std::uint32_t deleted_rows(const std::vector<std::uint32_t> & offsets, std::optional<std::uint32_t> count = {})
    {
        file_image payload{bytes{}};
        payload.word(count.value_or(static_cast<std::uint32_t>(offsets.size())));
        for (const std::uint32_t offset : offsets)
            payload.word(offset);
        return record(3, payload.content_);
    }
    std::uint32_t commit(std::uint64_t counter, std::uint32_t type = 0xFFFFFFFF)
    {
        return record(type, file_image(bytes{}).word(8).wide(counter).content_);
    }
    std::uint32_t old_commit(std::uint64_t counter) { return commit(counter, 0); }

    file_image & word(std::uint32_t value)
    {
        for (int i = 0; i < 4; ++i)
            content_.push_back(static_cast<std::uint8_t>(value >> 8 * i));
        return *this;
    }
    file_image & wide(std::uint64_t value)
    {
        return word(static_cast<std::uint32_t>(value)).word(static_cast<std::uint32_t>(value >> 32));
    }
    // Overwrites a word.
    file_image & at(std::uint32_t offset, std::uint32_t value)
    {
        for (unsigned i = 0; i < 4; ++i)
            content_.at(offset + i) = static_cast<std::uint8_t>(value >> 8 * i);
        return *this;
    }

  private:
    void metadata()
    {
        content_ = from_hex("5b 00 00 00 00 00 00 00 01 00 00 00 00 00 00 00"
                            "00 00 00 00 02 00 00 00 00 00 00 00 00 00 00 00"
                            "03 00 00 00 03 00 00 00 00 00 00 00 00 00 00 00"
                            "00 00 00 00 00 00 00 00 03 00 00 00 04 00 00 00"
                            "02 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00"
                            "00 00 00 00 69 64 00 76 61 6c 00");
    }
    bytes content_;
};

// ---- What the process holds and says ----

inline size_t open_descriptors()
{
    size_t count = 0;
    DIR *  p     = opendir("/proc/self/fd");
    while (readdir(p) != nullptr)
        ++count;
    closedir(p);
    return count;
}

// Works in a directory of its own: a failed sync leaves a file in the working directory.
class working_directory
{
  public:
    working_directory() : former_(std::filesystem::current_path()) { std::filesystem::current_path(dir_.path()); }
    ~working_directory() { std::filesystem::current_path(former_); }
    working_directory(const working_directory &)             = delete;
    working_directory & operator=(const working_directory &) = delete;
    std::string         witness() const { return dir_.file("reginfo_pid." + std::to_string(getpid())); }

  private:
    temp_dir              dir_;
    std::filesystem::path former_;
};

// The development lines that are made while it lives.
class trace_lines
{
  public:
    trace_lines() { tr_set_sink_1(keep, this); }
    ~trace_lines() { tr_set_sink_1(nullptr, nullptr); }
    trace_lines(const trace_lines &)             = delete;
    trace_lines & operator=(const trace_lines &) = delete;
    // Those that begin with the tag, as in "DV|APP|".
    std::vector<std::string> with(const std::string & tag) const
    {
        std::vector<std::string> result;
        for (const std::string & line : lines_)
            if (line.rfind(tag, 0) == 0)
                result.push_back(line);
        return result;
    }
    // The part of a line between the bars, counted from 0.
    static std::string field(const std::string & line, int number)
    {
        size_t begin = 0;
        for (; number > 0; --number)
            begin = line.find('|', begin) + 1;
        return line.substr(begin, line.find('|', begin) - begin);
    }

  private:
    static void keep(void * p_token, const tr_event_t * p_event)
    {
        if (p_event->kind == TR_EVENT_FORMATTED)
            static_cast<trace_lines *>(p_token)->lines_.push_back(p_event->p_text);
    }
    std::vector<std::string> lines_;
};

// Everything of a table's file and of its two paths, at the moment ahead of the nth call of one kind.
struct moment {
    bool                 reached = false;
    std::optional<bytes> table;
    std::optional<bytes> rewrite;

    void take(const registry_at & r)
    {
        reached = true;
        table   = file_exists(r.path) ? std::optional(read_file(r.path)) : std::nullopt;
        rewrite = file_exists(r.rewrite) ? std::optional(read_file(r.rewrite)) : std::nullopt;
    }
    // What an open finds after a crash at this moment.
    file_state state() const
    {
        temp_dir dir;
        if (table)
            write_file(dir.file("t"), *table);
        if (rewrite)
            write_file(dir.file("t.rewrite"), *rewrite);
        return state_in(dir.path());
    }
};

} // namespace kt_test
