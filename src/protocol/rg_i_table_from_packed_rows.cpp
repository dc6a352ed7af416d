// SPDX-License-Identifier: MIT
// rg_i_table_from_packed_rows: puts the rows of a packed table under a new table object, without copying them.
//
// Layer: protocol. Called by rg_x_create_table. The columns go the way of any new table; the rows stay in the array
// that was made of the buffer, whose elements look like records of the pool to everybody who reads them.
// Always holds: a row's own length word, which bounds every later read of the row, has been held against the columns
// before the row is entered. Values aren't looked at here, but for the key.
// Locking: nobody else can see the table yet; the caller holds the tree's write lock.
// Failure: no table. The array stays the caller's, the hash table is closed.
#include <cstdlib>

#include "frame/rg_i_trace.h"
#include "rg_i_table.h"

namespace
{

constexpr char module_version[] = "rg_i_table_from_packed_rows 1.0";

[[nodiscard]] kt_int32_t fail_reading(const rg_i_site_t & site, kt_int32_t result)
{
    return rg_i_fail_library_call(site, "kt_pmsg_build_conv_packed_client_value", result);
}

// Enters a row of which nothing is known but that its length word lies within its binary.
[[nodiscard]] kt_int32_t enter_row(rg_i_table_t * p_table, kt_char_ptr_t p_record)
{
    kt_char_ptr_t     p_row         = p_record + RG_I_RECORD_HEAD_LENGTH;
    const kt_uint64_t fixed_length  = kt_uint64_t{8} * p_table->total_columns + sizeof(kt_uint32_t);
    const kt_uint32_t record_length = rg_i_load_u32(p_record);
    if (record_length < RG_I_RECORD_HEAD_LENGTH + fixed_length)
        return fail_reading(RG_HERE, KT_PMSG_E_DAMAGED);

    const kt_data_type_t key_type = p_table->p_columns[0].type;
    kt_value_t           key;
    if (const kt_int32_t result = kt_pmsg_build_conv_packed_client_value_1(
            nullptr, 0, key_type, &key, rg_i_row_slot(p_row, 0), rg_i_row_indirect_data(p_row, p_table->total_columns),
            rg_i_row_indirect_length(p_table, p_row));
        result != 0)
        return fail_reading(RG_HERE, result);
    rg_i_index_entry_t *      p_index_entry      = nullptr;
    rg_hash_table_element_t * p_existing_element = nullptr;
    const kt_int32_t          rc = rg_i_add_row_raw(p_table, p_row, &key, &p_index_entry, &p_existing_element);
    if (rg_i_type_is_indirect(key_type))
        std::free(key.ptr_char);
    if (rc != 0)
        return rc;

    p_table->p_rows_packed_index[p_table->total_applied_rows] = rg_i_fixed_row_index(p_table, p_index_entry);
    p_index_entry->packed_index                               = p_table->total_applied_rows++;
    p_index_entry->p_committed                                = p_index_entry->p_applied;
    ++p_table->total_committed_rows;
    return 0;
}

} // namespace

kt_int32_t rg_i_create_read_only_transient_table_from_packed_rows(rg_i_tree_t * p_tree, kt_char_ptr_t p_name,
                                                                  rg_column_t * p_columns, kt_uint32_t total_columns,
                                                                  rg_hash_table_t * p_rows_hash_table,
                                                                  kt_array_ptr_t    p_packed_rows_array,
                                                                  rg_i_table_t **   p_table)
{
    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc = rg_i_create_transient_table_common(p_tree, p_name, p_columns, total_columns, RG_MODE_READ,
                                                                 p_rows_hash_table, &p_new_table);
        rc != 0)
        return rc;
    const kt_value_t * p_elements = p_packed_rows_array->elements;
    for (kt_uint32_t row = 0; row < p_packed_rows_array->element_count; ++row)
        if (const kt_int32_t rc = enter_row(p_new_table, reinterpret_cast<kt_char_ptr_t>(p_elements[row].ptr_binary));
            rc != 0) {
            rg_i_close_table(p_new_table);
            return rc;
        }
    p_new_table->p_packed_rows_array = p_packed_rows_array;
    p_new_table->mode                = RG_MODE_READ;
    *p_table                         = p_new_table;
    return 0;
}
