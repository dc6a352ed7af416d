// SPDX-License-Identifier: MIT
// registry: opening, reading and writing tables for ktrg.
//
// Locking: none of our own; one thread. Failure: every code of the library becomes a failure that names the table.
#include "registry.h"

#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <utility>

#include <fmt/format.h>
#include <sys/stat.h>

#include "column_definitions.h"
#include "failure.h"
#include "hold.h"
#include "selection.h"
#include "table_file.h"
#include "talk.h"
#include "values.h"

namespace ktrg
{

namespace
{

// About so many rows as a file of the length can hold.
std::uint64_t rows_for(const std::string & file, std::size_t columns)
{
    struct stat status {
    };
    if (stat(file.c_str(), &status) != 0)
        return 0;
    return static_cast<std::uint64_t>(status.st_size) / (16 + 8 * columns);
}

// The library takes the values of the criteria's variables as a list only. Ours have none.
kt_int32_t selected_rows(rg_opaque_handle_t handle, kt_char_ptr_t p_criteria, kt_uint32_t * p_count,
                         kt_uint32_t ** p_p_rows, ...)
{
    va_list none;
    va_start(none, p_p_rows);
    const kt_int32_t code = rg_get_selected_rows_v_1(handle, p_criteria, none, 0, p_count, p_p_rows);
    va_end(none);
    return code;
}

column column_of(const rg_column_t & definition)
{
    column result;
    result.name       = definition.name;
    result.type       = definition.type;
    result.qualifier  = definition.qualifier;
    result.properties = definition.properties;
    if (definition.sd_defn != nullptr)
        for (kt_uint32_t i = 0; i < definition.sd_defn->number_of_fields; i++)
            result.fields.push_back({definition.sd_defn->fields[i].name, definition.sd_defn->fields[i].type});
    result.default_text = default_text_of(result, definition.default_value);
    return result;
}

struct file_identity {
    dev_t device                                  = 0;
    ino_t inode                                   = 0;
    bool  operator==(const file_identity &) const = default;
};

file_identity identity_of(const std::string & file)
{
    struct stat status {
    };
    return stat(file.c_str(), &status) == 0 ? file_identity{status.st_dev, status.st_ino} : file_identity{};
}

} // namespace

// ---- Rows ----

row_values::row_values(const std::vector<column> & columns) : columns_(columns), values_(columns.size())
{
    for (std::size_t i = 0; i < columns_.size(); i++) {
        names_.push_back(writable(columns_[i].name));
        addresses_.push_back(&values_[i]);
    }
}

void row_values::release()
{
    for (std::size_t i = 0; i < columns_.size(); i++)
        if (is_indirect(columns_[i].type))
            std::free(std::exchange(values_[i].ptr_char, nullptr));
}

// ---- Opening ----

// What the open table says of itself is exact, also where a writer came between our look at the file and the open.
void table::take_metadata()
{
    constexpr kt_int32_t  all_columns = -1;
    rg_table_metadata_t * p_metadata  = nullptr;
    check(rg_get_table_metadata_1(handle_, all_columns, &p_metadata), where_);
    columns_.clear();
    for (kt_uint32_t i = 0; i < p_metadata->number_of_columns; i++)
        columns_.push_back(column_of(p_metadata->column_definitions[i]));
    rg_free_table_metadata_1(p_metadata);
    take_counts();
    if (where_.counter.has_value() && counter_ != *where_.counter)
        throw failure(
            exit_code::conflict, where_.name,
            fmt::format("the change counter is {}, not {}: the table has changed", counter_, *where_.counter));
}

void table::take_counts()
{
    rg_table_metadata_t * p_metadata = nullptr;
    check(rg_get_table_metadata_1(handle_, 0, &p_metadata), where_);
    counter_ = p_metadata->table_change_counter;
    rows_    = p_metadata->number_of_rows;
    rg_free_table_metadata_1(p_metadata);
}

// Opens the file, with an index of its keys if it can have one. A table that was filled without a check of its keys may
// hold two that are equal, and can't be indexed then.
void table::open(kt_int32_t mode, bool hashed)
{
    columns_ = read_table_columns(where_.file, where_.name);
    tree_    = tree(where_);
    tree_.mount(where_, where_.mounted_at);
    const key_hash hash = key_hash_for(columns_.front().type, rows_for(where_.file, columns_.size()));
    kt_int32_t     code = RG_E_DUPLICATE_KEY;
    if (hashed && hash.buckets != 0)
        code = rg_open_hashed_key_table_1(tree_.handle(), writable(where_.registry_path), mode, hash.buckets,
                                          hash.p_hash, hash.p_compare, &handle_);
    if (code == RG_E_DUPLICATE_KEY)
        code = rg_open_table_1(tree_.handle(), writable(where_.registry_path), mode, &handle_);
    check(code, where_);
}

void table::tell_open(const char * p_what, const stopwatch & time) const
{
    struct stat status {
    };
    if (verbose() && stat(where_.file.c_str(), &status) == 0)
        tell(fmt::format("{}: {}: {}, {}, {} bytes, counter {}, {}", where_.name, p_what, counted(rows_, "row"),
                         counted(columns_.size(), "column"), status.st_size, counter_, time.text()));
}

table table::open_for_reading(const place & where, bool hashed)
{
    table           result(where);
    const stopwatch time;
    struct stat     status {
    };
    if (stat(where.file.c_str(), &status) != 0 && errno == ENOENT)
        throw no_such_table(where);
    result.open(RG_MODE_READ, hashed);
    result.take_metadata();
    result.tell_open("open for reading", time);
    return result;
}

table table::open_for_writing(const place & where, double wait_seconds)
{
    constexpr int attempts = 100;
    for (int attempt = 0; attempt < attempts; attempt++) {
        wait_while_held(where, wait_seconds);
        table               result(where);
        const stopwatch     time;
        const file_identity before = identity_of(where.file);
        result.open(RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL, true);
        if (identity_of(where.file) == before) {
            result.take_metadata();
            result.tell_open("open for writing", time);
            return result;
        }
        // Another writer rewrote the table while we opened it: what we hold is its former file.
    }
    throw failure(exit_code::busy, where.name, "other processes keep rewriting the table");
}

void table::make(const std::string & registry_path, const std::vector<column> & columns, std::uint64_t expected_rows)
{
    columns_ = columns;
    column_definitions definitions(columns_, where_.name);
    const auto         count = static_cast<kt_uint32_t>(columns_.size());
    const kt_int32_t   mode  = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
    const key_hash     hash  = columns_.empty() ? key_hash{} : key_hash_for(columns_.front().type, expected_rows);
    kt_int32_t         code  = 0;
    if (hash.buckets != 0)
        code = rg_create_hashed_key_table_1(tree_.handle(), writable(registry_path), definitions.data(), count, mode,
                                            hash.buckets, hash.p_hash, hash.p_compare, &handle_);
    else
        code = rg_create_table_1(tree_.handle(), writable(registry_path), definitions.data(), count, mode, &handle_);
    if (code == RG_E_DUPLICATE_KEY)
        throw failure(exit_code::usage, where_.name, "two columns are marked as the key", code);
    if (code == RG_E_KEY_EXPECTED)
        throw failure(exit_code::usage, where_.name, "no column is marked as the key", code);
    check(code, where_);
}

table table::create(const place & where, const std::vector<column> & columns, std::uint64_t expected_rows)
{
    const stopwatch time;
    table           result(where);
    struct stat     status {
    };
    if (stat(where.file.c_str(), &status) == 0)
        throw registry_failure(RG_E_TABLE_EXISTS, where.name);
    result.tree_ = tree(where);
    result.tree_.mount(where, where.mounted_at);
    result.make(where.registry_path, columns, expected_rows);
    if (verbose()) {
        result.take_counts();
        result.tell_open("created", time);
    }
    return result;
}

table table::create_in_memory(const place & where, const std::vector<column> & columns, std::uint64_t expected_rows)
{
    table result(where);
    result.tree_ = tree(where);
    result.make("memory", columns, expected_rows);
    return result;
}

table table::from_packed(const place & where, void * p_buffer, kt_uint32_t index, const key_hash & hash)
{
    table result(where);
    result.tree_          = tree(where);
    const kt_int32_t code = rg_unpack_table_1(p_buffer, hash.buckets, hash.p_hash, hash.p_compare,
                                              result.tree_.handle(), index, &result.handle_);
    if (code == RG_E_NO_MEMORY)
        check(code, where);
    if (code != 0)
        throw failure(exit_code::damaged, where.name,
                      fmt::format("the packed file is damaged: {}", registry_failure(code, "").text()), code);
    result.take_metadata();
    return result;
}

table::table(table && other) noexcept
    : where_(std::move(other.where_)), columns_(std::move(other.columns_)), counter_(other.counter_),
      rows_(other.rows_), tree_(std::move(other.tree_)), handle_(std::exchange(other.handle_, nullptr))
{
}

table::~table()
{
    close();
}

void table::close()
{
    if (handle_ != nullptr)
        rg_close_table_1(std::exchange(handle_, nullptr));
    tree_.close();
}

// While we hold its lock, so that no other writer gets hold of it in between.
void table::drop()
{
    check(rg_delete_table_1(tree_.handle(), writable(where_.registry_path)), where_);
    close();
}

void table::remove()
{
    if (tree_.handle() != nullptr)
        rg_delete_table_1(tree_.handle(), writable(where_.registry_path));
    close();
}

// ---- Reading and writing ----

bool table::read(std::uint64_t position, row_values & values) const
{
    values.release();
    if (position > INT32_MAX)
        return false;
    const kt_int32_t code =
        rg_get_fields_by_index_1(handle_, static_cast<kt_int32_t>(position), values.names_.data(),
                                 values.addresses_.data(), static_cast<kt_uint32_t>(values.names_.size()));
    if (code == RG_E_NO_SUCH_INDEX)
        return false;
    if (code == RG_E_LIBRARY_CALL)
        throw failure(exit_code::damaged, where_.name, fmt::format("row {} holds a damaged value", position), code);
    check(code, where_);
    return true;
}

bool table::read_by_key(kt_value_t key, row_values & values) const
{
    values.release();
    const kt_int32_t code = rg_get_fields_by_key_1(handle_, key, values.names_.data(), values.addresses_.data(),
                                                   static_cast<kt_uint32_t>(values.names_.size()));
    if (code == RG_E_NO_SUCH_KEY || code == RG_E_ROW_DELETED)
        return false;
    if (code == RG_E_LIBRARY_CALL)
        throw failure(exit_code::damaged, where_.name, "the row holds a damaged value", code);
    check(code, where_);
    return true;
}

void table::read_fixed(kt_uint32_t row, row_values & values) const
{
    values.release();
    const kt_int32_t code = rg_get_fields_by_fixed_index_and_visibility_1(
        handle_, static_cast<kt_int32_t>(row), values.names_.data(), values.addresses_.data(),
        static_cast<kt_uint32_t>(values.names_.size()), 0, nullptr);
    if (code == RG_E_LIBRARY_CALL)
        throw failure(exit_code::damaged, where_.name, fmt::format("row {} holds a damaged value", row), code);
    check(code, where_);
}

std::vector<kt_uint32_t> table::matching(const std::string & expression) const
{
    check_expression(expression, columns_, where_.name);
    std::string   criteria = criteria_for(expression);
    kt_uint32_t   count    = 0;
    kt_uint32_t * p_rows   = nullptr;
    check(selected_rows(handle_, criteria.data(), &count, &p_rows), where_);
    std::vector<kt_uint32_t> rows(p_rows, p_rows + count);
    std::free(p_rows);
    return rows;
}

kt_int32_t table::add(const std::vector<kt_char_ptr_t> & names, const std::vector<kt_value_t *> & values) const
{
    // The library changes neither array.
    return rg_add_row_1(handle_, const_cast<kt_char_ptr_t *>(names.data()), const_cast<kt_value_t **>(values.data()),
                        static_cast<kt_uint32_t>(names.size()));
}

kt_int32_t table::set(kt_value_t key, const std::vector<kt_char_ptr_t> & names,
                      const std::vector<kt_value_t *> & values) const
{
    // An update of no columns still resets those that are flagged so; the arrays may not be NULL.
    kt_char_ptr_t no_name    = nullptr;
    kt_value_t *  p_no_value = nullptr;
    return rg_set_fields_by_key_1(handle_, key, names.empty() ? &no_name : const_cast<kt_char_ptr_t *>(names.data()),
                                  values.empty() ? &p_no_value : const_cast<kt_value_t **>(values.data()),
                                  static_cast<kt_uint32_t>(names.size()));
}

bool table::contains(kt_value_t key) const
{
    kt_uint32_t      row  = 0;
    const kt_int32_t code = rg_get_fixed_row_index_for_key_1(handle_, key, &row);
    if (code != RG_E_NO_SUCH_KEY)
        check(code, where_);
    return code == 0;
}

void table::delete_at(std::uint64_t position) const
{
    check(rg_delete_row_by_index_1(handle_, static_cast<kt_uint32_t>(position)), where_);
}

std::size_t table::delete_matching(const std::string & expression) const
{
    const std::size_t matches = matching(expression).size();
    if (matches != 0)
        check(rg_delete_rows_1(handle_, criteria_for(expression).data()), where_);
    return matches;
}

void table::delete_all() const
{
    check(rg_delete_rows_1(handle_, nullptr), where_);
}

std::optional<std::vector<unsigned char>> table::blob() const
{
    kt_binary_t *    p_blob = nullptr;
    const kt_int32_t code   = rg_get_application_metadata_1(handle_, &p_blob);
    if (code == RG_E_NO_SUCH_KEY)
        return std::nullopt;
    check(code, where_);
    std::vector<unsigned char> result(p_blob->data, p_blob->data + p_blob->length);
    std::free(p_blob);
    return result;
}

void table::set_blob(const std::vector<unsigned char> & blob) const
{
    std::vector<kt_uint32_t> block(1 + (offsetof(kt_binary_t, data) + blob.size()) / sizeof(kt_uint32_t) + 1);
    auto *                   p_blob = reinterpret_cast<kt_binary_t *>(block.data());
    p_blob->length                  = static_cast<kt_uint32_t>(blob.size());
    if (!blob.empty())
        std::memcpy(p_blob->data, blob.data(), blob.size());
    check(rg_set_application_metadata_1(handle_, p_blob), where_);
}

void table::finish(bool dry_run)
{
    if (!dry_run)
        commit();
    close();
}

void table::commit(std::uint64_t counter)
{
    const stopwatch time;
    check(rg_apply_1(handle_, counter), where_);
    check(rg_commit_1(handle_), where_);
    if (!verbose())
        return;
    take_counts();
    tell_open("committed", time);
}

} // namespace ktrg
