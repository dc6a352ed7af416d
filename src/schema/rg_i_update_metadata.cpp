// SPDX-License-Identifier: MIT
// rg_i_update_metadata: builds the table that a table becomes when columns are added, renamed or given another default.
//
// Layer: schema. Calls the description of a table, the creation of transient tables, and reading and adding rows, so
// that all rules of a creation hold for the new columns, and all rows go through the conversion of values.
// Always holds: rows keep their order and stand from slot 0 on. They are pending in the new table: who commits it is
// the caller's matter.
// Locking: the caller holds the table's write lock. No other thread can see the new table.
// Failure: nothing is left of the new table; the old one isn't touched at any time.
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "schema/rg_i_column_changes.h"
#include "schema/rg_i_get_table_metadata.h"

namespace
{

constexpr char module_version[] = "rg_i_update_metadata 1.0";

// What is asked for, and of which table.
struct change_t {
    rg_i_table_t & table;
    rg_column_t *  p_new_columns;
    kt_uint32_t    total_new_columns;
    kt_char_ptr_t  p_old_column_name; // of the column to change; NULL: none
    kt_char_ptr_t  p_new_column_name; // NULL: the column gets the default
    kt_value_t *   p_new_value;

    [[nodiscard]] kt_uint64_t total_columns() const { return kt_uint64_t{table.total_columns} + total_new_columns; }
};

template <class T> [[nodiscard]] bool allocate(owned_ptr<T> & array, kt_uint64_t count)
{
    array.reset(static_cast<T *>(std::malloc(count * sizeof(T))));
    return static_cast<bool>(array);
}

// ---- The columns ----

// Changes one of the columns of the table, which are described here in client form.
[[nodiscard]] kt_int32_t change_column(const change_t & change, rg_column_t * p_columns, kt_uint32_t described_columns)
{
    // Kept because callers depend on it: without a name the table is rebuilt as it is.
    if (change.p_old_column_name == nullptr)
        return 0;
    // Where a column is hidden, the description lacks it, and a table made of the rest would lose it.
    if (described_columns != change.table.total_columns)
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    const kt_uint32_t column = rg_i_find_column(&change.table, change.p_old_column_name);
    if (column == described_columns)
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    if (change.p_new_column_name != nullptr)
        p_columns[column].name = change.p_new_column_name;
    else
        p_columns[column].default_value = *change.p_new_value;
    return 0;
}

[[nodiscard]] kt_int32_t make_columns(const change_t & change, const rg_table_metadata_t & described,
                                      owned_ptr<rg_column_t> & columns)
{
    if (change.total_columns() > UINT32_MAX || !allocate(columns, change.total_columns()))
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(static_cast<void *>(columns.get()), described.column_definitions,
                described.number_of_columns * sizeof(rg_column_t));
    if (const kt_int32_t rc = change_column(change, columns.get(), described.number_of_columns); rc != 0)
        return rc;
    if (change.total_new_columns != 0)
        std::memcpy(static_cast<void *>(columns.get() + described.number_of_columns), change.p_new_columns,
                    change.total_new_columns * sizeof(rg_column_t));
    return 0;
}

// ---- The new table, still without rows ----

[[nodiscard]] kt_int32_t create_table(const change_t & change, rg_column_t * p_columns, rg_i_table_t ** p_p_new_table)
{
    rg_hash_table_t * p_hash_table = nullptr;
    if (const rg_hash_table_t * const p_old = change.table.p_rows_hash_table; p_old != nullptr)
        if (const kt_int32_t rc = rg_i_hash_table_open(p_old->total_hash_buckets, p_old->p_hash_function,
                                                       p_old->p_compare_function, &p_hash_table);
            rc != 0)
            return rc;
    return rg_i_create_transient_table(change.table.p_tree, change.table.p_name, p_columns,
                                       static_cast<kt_uint32_t>(change.total_columns()), RG_MODE_WRITE, p_hash_table,
                                       p_p_new_table);
}

// ---- The rows ----

// Carries rows from one table to another, which has the same columns and perhaps more. p_to_columns begins with these, in
// the order that they have in the first table: their names may differ, and so may their places where a damaged file has
// its key elsewhere than in front.
class row_carrier
{
  public:
    row_carrier(rg_i_table_t & from, rg_i_table_t & to) : from_(from), to_(to) {}

    [[nodiscard]] kt_int32_t prepare(const rg_column_t * p_to_columns)
    {
        const kt_uint32_t columns = from_.total_columns;
        if (!allocate(from_names_, columns) || !allocate(to_names_, columns) || !allocate(values_, columns) ||
            !allocate(p_values_, columns))
            return rg_i_fail_no_memory(RG_HERE);
        for (kt_uint32_t column = 0; column < columns; ++column) {
            from_names_.get()[column] = from_.p_columns[column].name;
            to_names_.get()[column]   = p_to_columns[column].name;
            p_values_.get()[column]   = &values_.get()[column];
        }
        return 0;
    }

    [[nodiscard]] kt_int32_t carry(kt_uint32_t packed_index)
    {
        for (kt_uint32_t column = 0; column < from_.total_columns; ++column)
            values_.get()[column].ptr_char = nullptr; // what a read that fails doesn't get to
        // Kept because callers depend on it: the read sees what is committed, unless the table shows pending updates. A
        // table in memory whose columns were changed before has rows that were never committed, and they end the change.
        kt_int32_t rc = rg_i_get_values_for_packed_index(&from_, packed_index, from_names_.get(), p_values_.get(),
                                                         from_.total_columns, 0, nullptr);
        if (rc == 0)
            rc = rg_i_add_row(&to_, to_names_.get(), p_values_.get(), from_.total_columns);
        for (kt_uint32_t column = 0; column < from_.total_columns; ++column)
            if (rg_i_type_is_indirect(from_.p_columns[column].type))
                std::free(values_.get()[column].ptr_char);
        return rc;
    }

  private:
    rg_i_table_t &           from_;
    rg_i_table_t &           to_;
    owned_ptr<kt_char_ptr_t> from_names_;
    owned_ptr<kt_char_ptr_t> to_names_;
    owned_ptr<kt_value_t>    values_;
    owned_ptr<kt_value_t *>  p_values_;
};

[[nodiscard]] kt_int32_t carry_rows(rg_i_table_t & from, rg_i_table_t & to, const rg_column_t * p_to_columns)
{
    row_carrier carrier(from, to);
    if (const kt_int32_t rc = carrier.prepare(p_to_columns); rc != 0)
        return rc;
    for (kt_uint32_t packed_index = 0; packed_index < from.total_applied_rows; ++packed_index)
        if (const kt_int32_t rc = carrier.carry(packed_index); rc != 0)
            return rc;
    return 0;
}

[[nodiscard]] kt_int32_t build(const change_t & change, const rg_table_metadata_t & described,
                               rg_i_table_t ** p_result_table)
{
    owned_ptr<rg_column_t> columns;
    if (const kt_int32_t rc = make_columns(change, described, columns); rc != 0)
        return rc;
    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc = create_table(change, columns.get(), &p_new_table); rc != 0)
        return rc;
    if (const kt_int32_t rc = carry_rows(change.table, *p_new_table, columns.get()); rc != 0) {
        rg_i_close_table(p_new_table);
        return rc;
    }
    *p_result_table = p_new_table;
    return 0;
}

} // namespace

kt_int32_t rg_i_update_metadata(rg_i_table_t * p_table, rg_column_t * p_new_columns, kt_uint32_t total_new_columns,
                                kt_char_ptr_t p_old_column_name, kt_char_ptr_t p_new_column_name,
                                kt_value_t * p_new_value, rg_i_table_t ** p_result_table)
{
    if (const kt_int32_t rc = rg_i_check_columns_can_change(RG_HERE, p_table); rc != 0)
        return rc;
    rg_table_metadata_t * p_described = nullptr;
    if (const kt_int32_t rc = rg_i_get_table_metadata(
            p_table, p_old_column_name != nullptr ? RG_I_VISIBLE_COLUMNS : RG_I_ALL_COLUMNS, &p_described);
        rc != 0)
        return rc;

    const kt_int32_t rc =
        build({*p_table, p_new_columns, total_new_columns, p_old_column_name, p_new_column_name, p_new_value},
              *p_described, p_result_table);
    // Kept because callers depend on it: the exported call releases the description, and clears the error record. So a
    // failure to build leaves its code alone.
    (void)rg_free_table_metadata_1(p_described);
    return rc;
}
