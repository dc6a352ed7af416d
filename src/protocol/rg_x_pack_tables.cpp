// SPDX-License-Identifier: MIT
// rg_x_pack_tables: turns open tables into one packed buffer.
//
// Layer: protocol, exported. Presents each table as four client values (rg_x_protocol.h), has the value library measure
// them all, and then lay them into one allocation of exactly that size.
// Always holds: strings go out in the tables' encoding, without conversion. The buffer is a snapshot of one moment: all
// tables are read-locked until the last byte is written. Tables aren't changed.
// Locking: the read locks of all tables, in the caller's order, a table as often as it is named. Neither ForkMutex nor
// the tree's lock, so the handles must stay open meanwhile.
// Failure: no buffer, nothing allocated, all locks released.
#include <cstdlib>

#include "frame/rg_i_call_frame.h"
#include "protocol/rg_i_packed_format.h"
#include "protocol/rg_x_protocol.h"

namespace
{

constexpr char module_version[] = "rg_x_pack_tables 1.0";

// What the caller gave.
struct request_t {
    kt_uint32_t          total_tables;
    rg_opaque_handle_t * p_table_handles;
    kt_uint32_t *        p_uncommitted_updates_visible;
    kt_uint32_t *        p_total_row_fixed_indices;
    kt_uint32_t *        p_row_fixed_indices;

    [[nodiscard]] rg_i_table_t * table(kt_uint32_t i) const { return static_cast<rg_i_table_t *>(p_table_handles[i]); }
};

// The client values of all tables, made in the size pass and used again in the build pass.
class presentations_t
{
  public:
    explicit presentations_t(kt_uint32_t total_tables)
        : p_p_fixed_metadata_SD(new_pointers<kt_sd_ptr_t>(total_tables)),
          p_p_column_metadata_array(new_pointers<kt_array_ptr_t>(total_tables)),
          p_p_packed_rows_array(new_pointers<kt_array_ptr_t>(total_tables)), total_tables_(total_tables)
    {
    }
    ~presentations_t()
    {
        for (kt_uint32_t i = 0; complete() && i < total_tables_; ++i) {
            std::free(p_p_fixed_metadata_SD.get()[i]);
            rg_i_free_packed_table_column_metadata_array(p_p_column_metadata_array.get()[i]);
            std::free(p_p_packed_rows_array.get()[i]);
        }
    }
    presentations_t(const presentations_t &)              = delete;
    presentations_t &  operator=(const presentations_t &) = delete;
    [[nodiscard]] bool complete() const
    {
        return p_p_fixed_metadata_SD && p_p_column_metadata_array && p_p_packed_rows_array;
    }

    const owned_ptr<kt_sd_ptr_t>    p_p_fixed_metadata_SD;
    const owned_ptr<kt_array_ptr_t> p_p_column_metadata_array;
    const owned_ptr<kt_array_ptr_t> p_p_packed_rows_array;

  private:
    template <class Pointer> [[nodiscard]] static owned_ptr<Pointer> new_pointers(kt_uint32_t total)
    {
        return owned_ptr<Pointer>(static_cast<Pointer *>(std::calloc(size_t{total} + 1, sizeof(Pointer))));
    }

    const kt_uint32_t total_tables_;
};

// The four values of a table in the order of the directory.
struct table_values_t {
    struct {
        kt_data_type_t type;
        kt_value_t     value;
    } items[sizeof(rg_i_packed_table_t) / sizeof(kt_pmsg_value_t)];
};

[[nodiscard]] table_values_t values_of(const request_t & request, const presentations_t & made, kt_uint32_t i)
{
    kt_char_ptr_t  p_name = request.table(i)->p_name;
    table_values_t values{};
    values.items[0].type            = KT_CHAR_PTR;
    values.items[0].value.ptr_char  = p_name != nullptr ? p_name : ku_ptr_empty_char_1;
    values.items[1].type            = KT_SD_PTR;
    values.items[1].value.ptr_sd    = made.p_p_fixed_metadata_SD.get()[i];
    values.items[2].type            = KT_SD_PTR_ARRAY;
    values.items[2].value.ptr_array = made.p_p_column_metadata_array.get()[i];
    values.items[3].type            = KT_BINARY_PTR_ARRAY;
    values.items[3].value.ptr_array = made.p_p_packed_rows_array.get()[i];
    return values;
}

[[nodiscard]] kt_int32_t present_table(const request_t & request, const presentations_t & made, kt_uint32_t i,
                                       size_t * p_current_row_fixed_index)
{
    rg_i_table_t *    p_table = request.table(i);
    const kt_uint32_t visible = request.p_uncommitted_updates_visible[i];
    const kt_uint32_t chosen  = request.p_total_row_fixed_indices[i];
    if (const kt_int32_t rc = rg_i_get_table_fixed_metadata_SD(p_table, visible, &made.p_p_fixed_metadata_SD.get()[i]);
        rc != 0)
        return rc;
    if (const kt_int32_t rc =
            rg_i_get_table_column_metadata_array(p_table, visible, &made.p_p_column_metadata_array.get()[i]);
        rc != 0)
        return rc;

    kt_array_ptr_t * p_p_rows = &made.p_p_packed_rows_array.get()[i];
    if (chosen == 0)
        return rg_i_get_table_row_array(p_table, visible, p_p_rows);
    kt_uint32_t * p_indices = request.p_row_fixed_indices + *p_current_row_fixed_index;
    *p_current_row_fixed_index += chosen;
    return rg_i_get_table_row_array_by_fixed_index(p_table, visible, chosen, p_indices, p_p_rows);
}

// Makes the client values of all tables and adds up what they will take. A sum that no buffer can tell in its header
// is refused as the value library refuses an item of that size.
[[nodiscard]] kt_int32_t size_pass(const request_t & request, const presentations_t & made,
                                   kt_uint32_t * p_buffer_length)
{
    kt_uint64_t length                  = rg_i_packed_fixed_length(request.total_tables);
    size_t      current_row_fixed_index = 0;
    for (kt_uint32_t i = 0; i < request.total_tables; ++i) {
        if (const kt_int32_t rc = present_table(request, made, i, &current_row_fixed_index); rc != 0)
            return rc;
        for (const auto & item : values_of(request, made, i).items) {
            kt_pmsg_len_t    size   = 0;
            const kt_int32_t result = kt_pmsg_size_conv_protocol_value_1(1, 0, item.type, &item.value, &size);
            if (result != 0)
                return rg_i_fail_library_call(RG_HERE, "kt_pmsg_size_conv_protocol_value", result);
            length += size;
        }
    }
    if (length > UINT32_MAX)
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_size_conv_protocol_value", KT_PMSG_E_NO_ROOM);
    *p_buffer_length = static_cast<kt_uint32_t>(length);
    return 0;
}

void write_head(kt_char_ptr_t p_buffer, kt_uint32_t buffer_length, kt_uint32_t total_tables)
{
    const rg_i_packed_head_t head{
        {buffer_length, RG_I_PACKED_VERSION, RG_I_PACKED_LOCAL_ARCH_PROPS, RG_I_PACKED_PROTO_TYPE, 0},
        {0, 0},
        {1, 0},
        {buffer_length, 0},
        {total_tables, 0}};
    std::memcpy(p_buffer, &head, sizeof head);
}

[[nodiscard]] kt_int32_t build_pass(const request_t & request, const presentations_t & made, kt_char_ptr_t p_buffer,
                                    kt_uint32_t buffer_length)
{
    const kt_uint64_t fixed_length    = rg_i_packed_fixed_length(request.total_tables);
    kt_char_ptr_t     p_slot          = p_buffer + RG_I_PACKED_DIRECTORY_OFFSET;
    kt_char_ptr_t     p_indirect_data = p_buffer + fixed_length;
    const auto        indirect_length = static_cast<kt_uint32_t>(buffer_length - fixed_length);
    kt_pmsg_off_t     running_offset  = 0;
    for (kt_uint32_t i = 0; i < request.total_tables; ++i)
        for (const auto & item : values_of(request, made, i).items) {
            const kt_int32_t result = kt_pmsg_build_conv_protocol_value_1(
                nullptr, 0, item.type, &item.value, p_slot, p_indirect_data, indirect_length, &running_offset);
            if (result != 0)
                return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_protocol_value", result);
            p_slot += sizeof(kt_pmsg_value_t);
        }
    return 0;
}

[[nodiscard]] kt_int32_t pack_locked_tables(const request_t & request, const presentations_t & made, void ** p_p_buffer)
{
    kt_uint32_t buffer_length = 0;
    if (const kt_int32_t rc = size_pass(request, made, &buffer_length); rc != 0)
        return rc;
    owned_buffer buffer(static_cast<char *>(std::malloc(buffer_length)));
    if (!buffer)
        return rg_i_fail_no_memory(RG_HERE);
    write_head(buffer.get(), buffer_length, request.total_tables);
    if (const kt_int32_t rc = build_pass(request, made, buffer.get(), buffer_length); rc != 0)
        return rc;
    *p_p_buffer = buffer.release();
    return 0;
}

// Takes the locks in the caller's order. A lock that fails gives back the ones taken, the last one first.
[[nodiscard]] kt_int32_t lock_tables(const request_t & request)
{
    for (kt_uint32_t i = 0; i < request.total_tables; ++i)
        if (const kt_int32_t rc = rg_i_rw_lock_read(&request.table(i)->lock); rc != 0) {
            while (i-- > 0)
                rg_i_rw_unlock_read(&request.table(i)->lock);
            return rc;
        }
    return 0;
}

void unlock_tables(const request_t & request)
{
    for (kt_uint32_t i = 0; i < request.total_tables; ++i)
        rg_i_rw_unlock_read(&request.table(i)->lock);
}

[[nodiscard]] kt_int32_t check_request(const request_t & request)
{
    if (request.total_tables == 0)
        return 0;
    if (request.p_table_handles == nullptr || request.p_uncommitted_updates_visible == nullptr ||
        request.p_total_row_fixed_indices == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    for (kt_uint32_t i = 0; i < request.total_tables; ++i) {
        if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, request.p_table_handles[i]); rc != 0)
            return rc;
        if (request.p_total_row_fixed_indices[i] != 0 && request.p_row_fixed_indices == nullptr)
            return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    }
    return 0;
}

[[nodiscard]] kt_int32_t pack_tables(const request_t & request, void ** p_p_buffer)
{
    if (p_p_buffer == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (const kt_int32_t rc = check_request(request); rc != 0)
        return rc;
    if (const kt_int32_t rc = lock_tables(request); rc != 0)
        return rc;

    const presentations_t made(request.total_tables);
    const kt_int32_t      rc =
        made.complete() ? pack_locked_tables(request, made, p_p_buffer) : rg_i_fail_no_memory(RG_HERE);
    unlock_tables(request);
    return rc;
}

} // namespace

extern "C" kt_int32_t rg_pack_tables_1(kt_uint32_t total_tables, rg_opaque_handle_t * p_table_handles,
                                       kt_uint32_t * p_uncommitted_updates_visible,
                                       kt_uint32_t * p_total_row_fixed_indices, kt_uint32_t * p_row_fixed_indices,
                                       void ** p_p_buffer)
{
    rg_i_trace_entry(entry_id::pack_tables);
    const request_t request{total_tables, p_table_handles, p_uncommitted_updates_visible, p_total_row_fixed_indices,
                            p_row_fixed_indices};
    return rg_i_finish_call(entry_id::pack_tables, pack_tables(request, p_p_buffer));
}
