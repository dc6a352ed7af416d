// SPDX-License-Identifier: MIT
// rg_x_copy_table: the exported copies and moves of whole tables, by handle and by name.
//
// Layer: whole, exported. Locking: ForkMutex; rg_i_duplicate_table takes the rest. Failure: what it returns.
#include "frame/rg_i_call_frame.h"
#include "whole/rg_i_duplicate_table.h"

namespace
{

constexpr char module_version[] = "rg_x_copy_table 1.0";

enum removes_source : kt_int32_t { copies = 0, moves = 1 };

template <entry_id id>
[[nodiscard]] kt_int32_t duplicate_by_handle(const rg_i_site_t & site, rg_opaque_handle_t table_handle,
                                             kt_char_ptr_t p_target_table_name, removes_source remove_source,
                                             kt_int32_t overwrite)
{
    return rg_i_exclusive_call<id>([&]() -> kt_int32_t {
        if (const kt_int32_t rc = rg_i_check_handle(site, table_handle); rc != 0)
            return rc;
        return rg_i_duplicate_table(static_cast<rg_i_table_t *>(table_handle)->p_tree, table_handle, nullptr,
                                    p_target_table_name, remove_source, overwrite);
    });
}

template <entry_id id>
[[nodiscard]] kt_int32_t duplicate_by_name(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_source_table_name,
                                           kt_char_ptr_t p_target_table_name, removes_source remove_source,
                                           kt_int32_t overwrite)
{
    return rg_i_exclusive_call<id>([&] {
        return rg_i_duplicate_table(tree_handle, nullptr, p_source_table_name, p_target_table_name, remove_source,
                                    overwrite);
    });
}

} // namespace

extern "C" kt_int32_t rg_copy_table_by_handle_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_target_table_name,
                                                kt_int32_t overwrite)
{
    return duplicate_by_handle<entry_id::copy_table_by_handle>(RG_HERE, table_handle, p_target_table_name, copies,
                                                               overwrite);
}

extern "C" kt_int32_t rg_copy_table_by_name_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_source_table_name,
                                              kt_char_ptr_t p_target_table_name, kt_int32_t overwrite)
{
    return duplicate_by_name<entry_id::copy_table_by_name>(tree_handle, p_source_table_name, p_target_table_name,
                                                           copies, overwrite);
}

extern "C" kt_int32_t rg_move_table_by_handle_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_target_table_name,
                                                kt_int32_t overwrite)
{
    return duplicate_by_handle<entry_id::move_table_by_handle>(RG_HERE, table_handle, p_target_table_name, moves,
                                                               overwrite);
}

extern "C" kt_int32_t rg_move_table_by_name_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_source_table_name,
                                              kt_char_ptr_t p_target_table_name, kt_int32_t overwrite)
{
    return duplicate_by_name<entry_id::move_table_by_name>(tree_handle, p_source_table_name, p_target_table_name, moves,
                                                           overwrite);
}
