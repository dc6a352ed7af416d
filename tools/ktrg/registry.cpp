// SPDX-License-Identifier: MIT
// registry: opening, reading and writing tables for ktrg.
//
// Locking: none of our own; one thread. Failure: every code of the library becomes a failure that names the table.
#include "registry.h"

#include <cerrno>
#include <chrono>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include "failure.h"
#include "interrupt.h"
#include "key_hash.h"
#include "selection.h"
#include "table_file.h"
#include "values.h"

namespace ktrg
{

namespace
{

// The library's parameters are not const, though it changes none of these.
kt_char_ptr_t writable(const std::string & text)
{
    return const_cast<kt_char_ptr_t>(text.c_str());
}

void check(kt_int32_t code, const place & where, std::string_view context = {})
{
    if (code == 0)
        return;
    if (code == RG_E_NO_SUCH_TABLE)
        throw no_such_table(where);
    throw registry_failure(code, where.name, context);
}

// About so many rows as a file of the length can hold.
std::uint64_t rows_for(const std::string & file, std::size_t columns)
{
    struct stat status {
    };
    if (stat(file.c_str(), &status) != 0)
        return 0;
    return static_cast<std::uint64_t>(status.st_size) / (16 + 8 * columns);
}

// Whether another process holds the file. Our descriptor is closed again before the library opens its own, so that no
// lock of ours goes with it.
bool is_held(const place & where)
{
    const int fd = open(where.file.c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0) {
        if (errno == ENOENT)
            throw no_such_table(where);
        if (errno == EACCES || errno == EPERM || errno == EROFS)
            throw failure(exit_code::not_permitted, where.name,
                          errno == EROFS ? "the file system is read-only" : "permission denied", RG_E_ACCESS);
        throw failure(exit_code::input_output, where.name, std::strerror(errno), RG_E_SYSTEM_CALL);
    }
    const bool held = lockf(fd, F_TEST, 0) != 0 && (errno == EACCES || errno == EAGAIN);
    close(fd);
    return held;
}

void wait_while_held(const place & where, double wait_seconds)
{
    using clock         = std::chrono::steady_clock;
    const auto deadline = clock::now() + std::chrono::duration<double>(wait_seconds);
    while (is_held(where)) {
        stop_if_interrupted();
        if (clock::now() >= deadline)
            throw failure(exit_code::busy, where.name,
                          wait_seconds > 0 ? "another process still holds the table"
                                           : "another process holds the table; --wait SECONDS waits for it");
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
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

// The columns as the library takes them. Defaults and names live as long as this does.
struct column_definitions {
    explicit column_definitions(const std::vector<column> & columns, const place & where)
    {
        for (const column & each : columns) {
            rg_column_t definition{};
            definition.name       = writable(each.name);
            definition.type       = each.type;
            definition.qualifier  = each.qualifier;
            definition.properties = each.properties;
            if (!each.fields.empty())
                definition.sd_defn = make_fields(each);
            if (!each.default_text.empty())
                definition.default_value = default_of(each, where);
            definitions.push_back(definition);
        }
    }

    std::vector<rg_column_t> definitions;

  private:
    rg_sd_def_t * make_fields(const column & of)
    {
        auto * p_definition = static_cast<rg_sd_def_t *>(
            arena_.allocate(offsetof(rg_sd_def_t, fields) + of.fields.size() * sizeof(rg_field_def_t)));
        p_definition->number_of_fields = static_cast<kt_uint32_t>(of.fields.size());
        for (std::size_t i = 0; i < of.fields.size(); i++)
            p_definition->fields[i] = {of.fields[i].type, writable(of.fields[i].name)};
        return p_definition;
    }

    kt_value_t default_of(const column & of, const place & where)
    {
        try {
            return parse_value(of.type, of.fields, of.default_text, arena_);
        } catch (const failure & what) {
            throw failure(exit_code::usage, where.name, fmt::format("the default of \"{}\": {}", of.name, what.text()),
                          RG_E_INVALID_COLUMN);
        }
    }

    value_arena arena_;
};

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

void table::open_tree()
{
    check(rg_open_tree_1(&tree_, 0, 0), where_);
}

// The library makes a directory that it doesn't find. Here a wrong name is a mistake to be told.
void table::mount()
{
    struct stat status {
    };
    if (stat(where_.directory.c_str(), &status) != 0)
        throw no_such_table(where_);
    open_tree();
    check(rg_mount_local_tree_1(tree_, const_cast<kt_char_ptr_t>(mount_point), writable(where_.directory), 0), where_);
}

// What the open table says of itself is exact, also where a writer came between our look at the file and the open.
void table::take_metadata()
{
    constexpr kt_int32_t  all_columns = -1;
    rg_table_metadata_t * p_metadata  = nullptr;
    check(rg_get_table_metadata_1(handle_, all_columns, &p_metadata), where_);
    counter_ = p_metadata->table_change_counter;
    rows_    = p_metadata->number_of_rows;
    columns_.clear();
    for (kt_uint32_t i = 0; i < p_metadata->number_of_columns; i++)
        columns_.push_back(column_of(p_metadata->column_definitions[i]));
    rg_free_table_metadata_1(p_metadata);
    if (where_.counter.has_value() && counter_ != *where_.counter)
        throw failure(
            exit_code::conflict, where_.name,
            fmt::format("the change counter is {}, not {}: the table has changed", counter_, *where_.counter));
}

table table::open_for_reading(const place & where, bool hashed)
{
    table       result(where);
    struct stat status {
    };
    if (stat(where.file.c_str(), &status) != 0 && errno == ENOENT)
        throw no_such_table(where);
    result.columns_ = read_table_columns(where.file, where.name);
    result.mount();
    const key_hash hash = key_hash_for(result.columns_.front().type, rows_for(where.file, result.columns_.size()));
    kt_int32_t     code = RG_E_DUPLICATE_KEY;
    if (hashed && hash.buckets != 0)
        code = rg_open_hashed_key_table_1(result.tree_, writable(where.registry_path), RG_MODE_READ, hash.buckets,
                                          hash.p_hash, hash.p_compare, &result.handle_);
    // A table that was filled without a check of its keys may hold two that are equal, and can't be indexed then.
    if (code == RG_E_DUPLICATE_KEY)
        code = rg_open_table_1(result.tree_, writable(where.registry_path), RG_MODE_READ, &result.handle_);
    check(code, where);
    result.take_metadata();
    return result;
}

table table::open_for_writing(const place & where, double wait_seconds)
{
    constexpr int attempts = 100;
    for (int attempt = 0; attempt < attempts; attempt++) {
        wait_while_held(where, wait_seconds);
        table               result(where);
        const file_identity before = identity_of(where.file);
        result.columns_            = read_table_columns(where.file, where.name);
        result.mount();
        const key_hash hash = key_hash_for(result.columns_.front().type, rows_for(where.file, result.columns_.size()));
        const kt_int32_t mode = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
        if (hash.buckets != 0)
            check(rg_open_hashed_key_table_1(result.tree_, writable(where.registry_path), mode, hash.buckets,
                                             hash.p_hash, hash.p_compare, &result.handle_),
                  where);
        else
            check(rg_open_table_1(result.tree_, writable(where.registry_path), mode, &result.handle_), where);
        if (identity_of(where.file) == before) {
            result.take_metadata();
            return result;
        }
        // Another writer rewrote the table while we opened it: what we hold is its former file.
    }
    throw failure(exit_code::busy, where.name, "other processes keep rewriting the table");
}

void table::make(const std::string & registry_path, const std::vector<column> & columns, std::uint64_t expected_rows)
{
    columns_ = columns;
    column_definitions definitions(columns_, where_);
    const auto         count = static_cast<kt_uint32_t>(columns_.size());
    const kt_int32_t   mode  = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
    const key_hash     hash  = columns_.empty() ? key_hash{} : key_hash_for(columns_.front().type, expected_rows);
    kt_int32_t         code  = 0;
    if (hash.buckets != 0)
        code = rg_create_hashed_key_table_1(tree_, writable(registry_path), definitions.definitions.data(), count, mode,
                                            hash.buckets, hash.p_hash, hash.p_compare, &handle_);
    else
        code = rg_create_table_1(tree_, writable(registry_path), definitions.definitions.data(), count, mode, &handle_);
    if (code == RG_E_DUPLICATE_KEY)
        throw failure(exit_code::usage, where_.name, "two columns are marked as the key", code);
    if (code == RG_E_KEY_EXPECTED)
        throw failure(exit_code::usage, where_.name, "no column is marked as the key", code);
    check(code, where_);
}

table table::create(const place & where, const std::vector<column> & columns, std::uint64_t expected_rows)
{
    table       result(where);
    struct stat status {
    };
    if (stat(where.file.c_str(), &status) == 0)
        throw registry_failure(RG_E_TABLE_EXISTS, where.name);
    result.mount();
    result.make(where.registry_path, columns, expected_rows);
    return result;
}

table table::create_in_memory(const place & where, const std::vector<column> & columns, std::uint64_t expected_rows)
{
    table result(where);
    result.open_tree();
    result.make("memory", columns, expected_rows);
    return result;
}

table::table(table && other) noexcept
    : where_(std::move(other.where_)), columns_(std::move(other.columns_)), counter_(other.counter_),
      rows_(other.rows_), tree_(std::exchange(other.tree_, nullptr)), handle_(std::exchange(other.handle_, nullptr))
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
    if (tree_ != nullptr)
        rg_close_tree_1(std::exchange(tree_, nullptr));
}

void table::remove()
{
    // While we hold its lock, so that no other writer gets hold of it in between.
    if (tree_ != nullptr)
        rg_delete_table_1(tree_, writable(where_.registry_path));
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

void table::finish(bool dry_run)
{
    if (!dry_run)
        commit();
    close();
}

void table::commit()
{
    check(rg_apply_1(handle_, 0), where_);
    check(rg_commit_1(handle_), where_);
}

} // namespace ktrg
