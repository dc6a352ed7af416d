// SPDX-License-Identifier: MIT
// rg_i_call_frame: what every exported call does around its worker, written once.
//
// Two frames: an updating call runs alone in its process, under ForkMutex, with the table's write lock; a reading call
// takes the table's read lock only. Scopes show the order: both locks are released before the error record is cleared
// and the exit is traced. The calls that depart from both frames are written out in full where they stand.
#pragma once

#include "kt_ku.h"
#include "rg_i_guards.h"
#include "rg_i_table.h"
#include "rg_i_trace.h"

// The trace id of each call's entry; its exit is the number behind.
enum class entry_id : kt_uint32_t {
    abort                                    = 1,
    add_columns                              = 3,
    add_row                                  = 5,
    apply                                    = 7,
    change_column_name                       = 9,
    change_default_value                     = 11,
    close_table                              = 13,
    close_tree                               = 15,
    commit                                   = 17,
    copy_table_by_handle                     = 19,
    copy_table_by_name                       = 21,
    create_table                             = 23,
    create_hashed_key_table                  = 25,
    delete_columns                           = 27,
    delete_row_by_index                      = 29,
    delete_rows                              = 31,
    delete_table                             = 33,
    free_table_list                          = 35,
    free_table_metadata                      = 37,
    get_application_metadata                 = 39,
    get_duplicate_rows                       = 41,
    get_field_by_fixed_index_and_visibility  = 43,
    get_field_by_index                       = 45,
    get_field_by_index_and_visibility        = 47,
    get_field_by_key                         = 49,
    get_field_by_key_and_visibility          = 51,
    get_fields_by_fixed_index_and_visibility = 53,
    get_fields_by_index                      = 55,
    get_fields_by_index_and_visibility       = 57,
    get_fields_by_key                        = 59,
    get_fields_by_key_and_visibility         = 61,
    get_selected_rows_v                      = 63,
    get_table_metadata                       = 65,
    get_updated_rows                         = 67,
    list_tables                              = 69,
    mount_local_tree                         = 71,
    move_table_by_handle                     = 73,
    move_table_by_name                       = 75,
    open_table                               = 77,
    open_hashed_key_table                    = 79,
    open_tree                                = 81,
    overlay_memory_column_qualifier          = 83,
    overlay_memory_default_value             = 85,
    repair_tables                            = 87,
    select                                   = 89,
    set_application_metadata                 = 91,
    set_field_by_fixed_index                 = 93,
    set_field_by_index                       = 95,
    set_field_by_key                         = 97,
    set_fields_by_fixed_index                = 99,
    set_fields_by_index                      = 101,
    set_fields_by_key                        = 103,
    unmount_local_tree                       = 105,
    get_fixed_row_index_for_key              = 107,
    pack_tables                              = 109,
    unpack_table                             = 111,
    get_total_packed_tables                  = 113,
    get_packed_table_name                    = 115,
    convert_packed_table_buffer              = 117,
};

inline void rg_i_trace_entry(entry_id id)
{
    if (rg_i_traces(RG_I_TRACE_API))
        tr_record_id_1(RG_I_TRACE_COMPONENT, static_cast<kt_uint32_t>(id));
}

inline void rg_i_trace_exit(entry_id id, kt_int32_t rc)
{
    if (rg_i_traces(RG_I_TRACE_API))
        tr_record_values_32_1(RG_I_TRACE_COMPONENT, static_cast<kt_uint32_t>(id) + 1, 1, static_cast<kt_uint32_t>(rc));
}

// The end of every call: a success clears the error record, and then the exit is traced. No lock is held any more.
inline kt_int32_t rg_i_finish_call(entry_id id, kt_int32_t rc)
{
    if (rc == 0)
        ku_set_no_error_1();
    rg_i_trace_exit(id, rc);
    return rc;
}

// A handle is tested for NULL and nothing else. `site` names the exported function.
[[nodiscard]] inline kt_int32_t rg_i_check_handle(const rg_i_site_t & site, rg_opaque_handle_t handle)
{
    return handle == nullptr ? rg_i_fail(site, RG_E_INVALID_HANDLE) : 0;
}

// Applies and commits what an update on an implicitly controlled table left pending. A failed apply takes the update
// back; a failed commit doesn't.
[[nodiscard]] inline kt_int32_t rg_i_complete_implicitly(rg_i_table_t & table)
{
    if (const kt_int32_t rc = rg_i_apply(&table, rg_i_rewrite_is_due(&table), 0); rc != 0) {
        rg_i_abort(&table);
        return rc;
    }
    return rg_i_commit(&table);
}

// What every updating call has around it: refused in a forked child, traced, and one at a time in a process. The worker
// tests its handle and takes its own locks.
template <entry_id id, class Worker> [[nodiscard]] kt_int32_t rg_i_exclusive_call(Worker && worker)
{
    if (In_Child_Process != 0)
        return RG_E_INTERNAL; // no record and no event: the parent's state is not ours to touch

    rg_i_trace_entry(id);
    const kt_int32_t rc = [&]() -> kt_int32_t {
        const mutex_guard fork_lock(ForkMutex);
        return worker();
    }();
    return rg_i_finish_call(id, rc);
}

enum class needs_write_mode { no, yes };
enum class completes_implicitly { no, yes };

// The frame of an updating call. The worker gets the table, write-locked.
template <entry_id id, needs_write_mode write_mode, completes_implicitly completes, class Worker>
[[nodiscard]] kt_int32_t rg_i_updating_frame(const rg_i_site_t & site, rg_opaque_handle_t table_handle,
                                             Worker && worker)
{
    return rg_i_exclusive_call<id>([&]() -> kt_int32_t {
        if (const kt_int32_t rc = rg_i_check_handle(site, table_handle); rc != 0)
            return rc;
        rg_i_table_t &    table = *static_cast<rg_i_table_t *>(table_handle);
        const write_guard table_lock(table.lock);
        if (table_lock.code() != 0)
            return table_lock.code();
        if constexpr (write_mode == needs_write_mode::yes)
            if ((table.mode & RG_MODE_WRITE) == 0)
                return rg_i_fail(site, RG_E_ACCESS);

        const kt_int32_t rc = worker(table);
        if constexpr (completes == completes_implicitly::yes)
            if (rc == 0 && table.implicitly_controlled != 0)
                return rg_i_complete_implicitly(table);
        return rc;
    });
}

// A row update: needs a table open for writing, and completes by itself on an implicitly controlled one.
template <entry_id id, class Worker>
[[nodiscard]] kt_int32_t rg_i_updating_call(const rg_i_site_t & site, rg_opaque_handle_t table_handle, Worker && worker)
{
    return rg_i_updating_frame<id, needs_write_mode::yes, completes_implicitly::yes>(site, table_handle, worker);
}

// Apply, commit, abort.
template <entry_id id, class Worker>
[[nodiscard]] kt_int32_t rg_i_transaction_call(const rg_i_site_t & site, rg_opaque_handle_t table_handle,
                                               Worker && worker)
{
    return rg_i_updating_frame<id, needs_write_mode::yes, completes_implicitly::no>(site, table_handle, worker);
}

// A change of the tree: the frame of an updating call up to the handle test; the worker takes the tree's lock itself.
template <entry_id id, class Worker>
[[nodiscard]] kt_int32_t rg_i_tree_updating_call(const rg_i_site_t & site, rg_opaque_handle_t tree_handle,
                                                 Worker && worker)
{
    return rg_i_exclusive_call<id>([&]() -> kt_int32_t {
        if (const kt_int32_t rc = rg_i_check_handle(site, tree_handle); rc != 0)
            return rc;
        return worker(*static_cast<rg_i_tree_t *>(tree_handle));
    });
}

// The frame of a reading call. The worker gets the table, read-locked. A forked child may read what it inherited.
template <entry_id id, class Worker>
[[nodiscard]] kt_int32_t rg_i_reading_call(const rg_i_site_t & site, rg_opaque_handle_t table_handle, Worker && worker)
{
    rg_i_trace_entry(id);
    const kt_int32_t rc = [&]() -> kt_int32_t {
        if (const kt_int32_t handle_rc = rg_i_check_handle(site, table_handle); handle_rc != 0)
            return handle_rc;
        rg_i_table_t &   table = *static_cast<rg_i_table_t *>(table_handle);
        const read_guard table_lock(table.lock);
        if (table_lock.code() != 0)
            return table_lock.code();
        return worker(table);
    }();
    return rg_i_finish_call(id, rc);
}
