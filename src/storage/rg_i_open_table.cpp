// SPDX-License-Identifier: MIT
// rg_i_open_table: turns a table file into the table in memory. It is the whole crash recovery too.
//
// Layer: storage. Calls the file wrappers (rg_i_files), the pool and the row index; called where a table is opened,
// upgraded or copied.
// Always holds: nothing behind the first live commit record is looked at, so that what a crash left there doesn't
// matter, and nothing is written to the file. The records lie one behind the other in one block of the pool, each
// longer by its head's growth, and what turns out dead is freed out of the middle of that block.
// The file is not trusted: every access is bounded by what was read, every walk moves on, and what a record names must
// lie ahead of it. A row's anchors are left to those who read rows.
// Locking: the caller holds the tree's write lock; a writer waits for the file's lock under it, a reader takes none.
// Failure: both the table and the file's bytes are gone, and with the descriptor the lock.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"
#include "storage/rg_i_files.h"
#include "storage/rg_i_table_file.h"

namespace
{

constexpr char module_version[] = "rg_i_open_table 1.0";

constexpr kt_uint32_t record_head_length = sizeof(rg_i_disk_record_metadata_t);
constexpr kt_uint32_t room_to_grow       = 4096; // by which a read notices that the file has grown
constexpr kt_uint32_t rows_if_none       = 100;  // slots of a table whose file has no room for a row

static_assert(RG_I_RECORD_HEAD_LENGTH == record_head_length + RG_I_MEMORY_RECORD_EXCESS);

// One open: the table under construction and the bytes of its file.
struct open_t {
    rg_i_table_t & table;
    owned_buffer   file{};            // what was read; a row's first data word takes its slot in the replay
    kt_uint32_t    file_length   = 0; // bytes read
    kt_uint32_t    commit_offset = 0; // of the live commit record
    kt_uint64_t    memory_length = 0; // of all records up to the commit record, in memory
    kt_uint32_t    block_length  = 0; // of the block that holds them
    owned_buffer   row_starts{};      // one bit a byte of the file: a row record starts here. Made when first needed

    [[nodiscard]] kt_char_ptr_t               at(kt_uint32_t offset) const { return file.get() + offset; }
    [[nodiscard]] rg_i_disk_record_metadata_t head_at(kt_uint32_t offset) const
    {
        return rg_i_load<rg_i_disk_record_metadata_t>(at(offset));
    }
};

[[nodiscard]] kt_int32_t unreadable(const rg_i_site_t & site)
{
    return rg_i_fail(site, RG_E_TABLE_UNREADABLE);
}

// ---- The file's bytes ----

[[nodiscard]] kt_int32_t open_file(rg_i_table_t & table, kt_int32_t mode)
{
    const kt_char_ptr_t p_path = rg_i_set_data_path(&table);
    const bool          writes = (mode & RG_MODE_WRITE) != 0;
    table.file_fd              = rg_i_open_file(p_path, writes ? O_RDWR : O_RDONLY, 0644);
    if (table.file_fd < 0) {
        switch (errno) {
        case EACCES:
            return rg_i_fail(RG_HERE, RG_E_ACCESS);
        case ENOENT:
            return rg_i_fail(RG_HERE, RG_E_NO_SUCH_TABLE);
        case ENOSPC:
            trace_filesystem_full_for_path(p_path);
            return RG_E_FILESYSTEM_FULL_DETAIL;
        default:
            return rg_i_fail_system_call(RG_HERE, "open", errno);
        }
    }
    // Kept because callers depend on it: who waited here while the holder's rewrite took the name has the lock of the
    // old file, and reads that.
    if (writes && lockf(table.file_fd, F_LOCK, 0) != 0)
        return rg_i_fail_system_call(RG_HERE, "lockf", errno);
    return 0;
}

// Takes the file's length into disk_file_length, and seeks back to its start.
[[nodiscard]] kt_int32_t measure_file(rg_i_table_t & table)
{
    const off64_t length = lseek64(table.file_fd, 0, SEEK_END);
    if (length < 0)
        return rg_i_fail_system_call(RG_HERE, "lseek64", errno);
    // A file without as much as a record's head is none. One that outgrows the width of offsets was never written here.
    if (length <= record_head_length || length > UINT32_MAX)
        return unreadable(RG_HERE);
    if (lseek64(table.file_fd, 0, SEEK_SET) < 0)
        return rg_i_fail_system_call(RG_HERE, "lseek64", errno);
    table.disk_file_length = static_cast<kt_uint32_t>(length);
    return 0;
}

// Reads up to capacity bytes. One read is the rule. Only where it delivers less than the file was measured to have is
// it continued: a single read transfers less than 2 GiB.
[[nodiscard]] kt_int32_t read_bytes(const rg_i_table_t & table, kt_char_ptr_t p_buffer, size_t capacity,
                                    size_t * p_bytes_read)
{
    size_t bytes_read = 0;
    do {
        const ssize_t result = read(table.file_fd, p_buffer + bytes_read, capacity - bytes_read);
        if (result < 0)
            return rg_i_fail_system_call(RG_HERE, "read", errno);
        if (result == 0)
            break;
        bytes_read += static_cast<size_t>(result);
    } while (bytes_read < table.disk_file_length);
    *p_bytes_read = bytes_read;
    return 0;
}

// A reader holds no lock, so the file may grow meanwhile. A buffer that was filled to the end may lack some of it.
[[nodiscard]] kt_int32_t read_file(open_t & open)
{
    for (;;) {
        if (const kt_int32_t rc = measure_file(open.table); rc != 0)
            return rc;
        const size_t capacity = size_t{open.table.disk_file_length} + room_to_grow;
        open.file.reset();
        open.file.reset(static_cast<kt_char_ptr_t>(std::malloc(capacity)));
        if (!open.file)
            return rg_i_fail_no_memory(RG_HERE);

        size_t bytes_read = 0;
        if (const kt_int32_t rc = read_bytes(open.table, open.file.get(), capacity, &bytes_read); rc != 0)
            return rc;
        if (bytes_read == capacity)
            continue;
        if (bytes_read <= record_head_length || bytes_read > UINT32_MAX)
            return unreadable(RG_HERE);
        open.file_length = static_cast<kt_uint32_t>(bytes_read);
        return 0;
    }
}

// ---- Measuring ----

// Whether a record with this head lies in the file's bytes.
[[nodiscard]] bool lies_in_file(const open_t & open, kt_uint32_t offset, const rg_i_disk_record_metadata_t & head)
{
    return head.record_length <= open.file_length - offset;
}

// Walks the records up to the live commit record, which decides where the table ends.
[[nodiscard]] kt_int32_t find_commit_record(open_t & open, kt_uint32_t * p_total_records)
{
    kt_uint32_t                 offset = 0;
    rg_i_disk_record_metadata_t head   = open.head_at(0); // whatever its type says, it is the metadata record
    *p_total_records                   = 1;
    do {
        if (head.record_length < record_head_length)
            return unreadable(RG_HERE);
        if (!lies_in_file(open, offset, head) || open.file_length - offset - head.record_length < record_head_length)
            return rg_i_fail(RG_HERE, RG_E_NO_COMMIT_RECORD);
        offset += head.record_length;
        head = open.head_at(offset);
        ++*p_total_records;
    } while (head.type != RG_RECORD_TYPE_COMMIT);

    if (head.record_length < sizeof(rg_i_disk_commit_record_t) || !lies_in_file(open, offset, head))
        return unreadable(RG_HERE);
    open.commit_offset = offset;
    return 0;
}

// Looks at the head of the metadata record, and takes the sizes that the memory image will have.
[[nodiscard]] kt_int32_t rg_i_calc_mem_table_size(open_t & open, kt_uint32_t * p_real_mem_metadata_record_length)
{
    kt_uint32_t total_records = 0;
    if (const kt_int32_t rc = find_commit_record(open, &total_records); rc != 0)
        return rc;

    const kt_uint32_t metadata_length = open.head_at(0).record_length;
    if (metadata_length < sizeof(rg_i_disk_metadata_record_t))
        return unreadable(RG_HERE);
    const auto        metadata      = rg_i_load<rg_i_disk_metadata_record_t>(open.at(0));
    const kt_uint32_t total_columns = metadata.head.total_columns;
    if (total_columns == 0 || total_columns > (metadata_length - sizeof metadata) / sizeof(rg_disk_column_t))
        return unreadable(RG_HERE);
    open.table.total_columns = total_columns;

    const kt_uint64_t column_excess = kt_uint64_t{total_columns} * RG_I_MEMORY_COLUMN_EXCESS;
    open.memory_length              = kt_uint64_t{open.commit_offset} + open.head_at(open.commit_offset).record_length +
                         kt_uint64_t{total_records} * RG_I_MEMORY_RECORD_EXCESS + column_excess;
    if (open.memory_length > UINT32_MAX)
        return rg_i_fail_no_memory(RG_HERE); // beyond what a pool can hold
    *p_real_mem_metadata_record_length =
        metadata_length + RG_I_MEMORY_RECORD_EXCESS + static_cast<kt_uint32_t>(column_excess);
    return 0;
}

// ---- The metadata record ----

// Takes one block for the whole image, as one record, and makes that its first record: the metadata record.
[[nodiscard]] kt_int32_t take_image_block(open_t & open, kt_uint32_t metadata_record_length)
{
    rg_i_record_buffer_pool_t * p_pool                 = &open.table.record_buffer_pool;
    kt_char_ptr_t               p_data                 = nullptr;
    kt_char_ptr_t               p_previous_free_record = nullptr;
    kt_uint32_t                 actual_data_length     = 0;
    const auto                  wanted = static_cast<kt_uint32_t>(open.memory_length) - RG_I_RECORD_HEAD_LENGTH;
    if (const kt_int32_t rc =
            rg_i_rb_lend_record(p_pool, wanted, &p_data, &p_previous_free_record, &actual_data_length);
        rc != 0)
        return rc;
    if (const kt_int32_t rc =
            rg_i_rb_take_record(p_pool, p_data, p_previous_free_record, actual_data_length, RG_RECORD_TYPE_METADATA);
        rc != 0)
        return rc;
    rg_i_record_head(p_data)->record_length = metadata_record_length;
    open.block_length                       = actual_data_length + RG_I_RECORD_HEAD_LENGTH;
    open.table.p_metadata_record_data       = p_data;
    open.table.p_columns                    = reinterpret_cast<rg_column_t *>(p_data + sizeof(rg_i_metadata_head_t));
    return 0;
}

// The variable data region of the metadata record. Default data, names and definitions must fit in it one behind the
// other, so that reading them all costs no more than its length.
struct region_t {
    kt_char_ptr_t p_start;
    kt_uint32_t   length;
    kt_uint32_t   spare; // bytes that nothing has claimed so far
};

// Claims the terminated string at the offset. False: it doesn't fit.
[[nodiscard]] bool claim_string(region_t & region, kt_uint32_t offset)
{
    if (offset >= region.length)
        return false;
    const kt_uint32_t bound  = std::min(region.length - offset, region.spare);
    const size_t      length = strnlen(region.p_start + offset, bound);
    if (length == bound)
        return false;
    region.spare -= static_cast<kt_uint32_t>(length) + 1;
    return true;
}

[[nodiscard]] bool claim_bytes(region_t & region, kt_uint32_t offset, kt_uint32_t length)
{
    if (offset > region.length || length > region.length - offset || length > region.spare)
        return false;
    region.spare -= length;
    return true;
}

// Claims a structured data definition: a count, and for each field a type and a name.
[[nodiscard]] bool claim_definition(region_t & region, kt_uint32_t offset)
{
    if (!claim_bytes(region, offset, sizeof(rg_disk_sd_def_t)))
        return false;
    const auto definition = rg_i_load<rg_disk_sd_def_t>(region.p_start + offset);
    offset += sizeof definition;
    for (kt_uint32_t field = 0; field < definition.number_of_fields; ++field) {
        if (!claim_bytes(region, offset, sizeof(kt_data_type_t)))
            return false;
        offset += sizeof(kt_data_type_t);
        if (!claim_string(region, offset))
            return false;
        offset += static_cast<kt_uint32_t>(std::strlen(region.p_start + offset)) + 1;
    }
    return true;
}

// Whether the default value of a column lies in the region, if it is one that has its data there.
[[nodiscard]] bool default_fits(const region_t & region, const rg_disk_column_t & disk_column)
{
    if (!rg_i_type_is_indirect(disk_column.type))
        return true;
    const auto anchor = rg_i_load<kt_pmsg_value_anchor_t>(disk_column.default_value);
    return anchor.offset <= region.length && anchor.length <= region.length - anchor.offset;
}

[[nodiscard]] bool convert_column(region_t & region, const rg_disk_column_t & disk_column, rg_column_t * p_column)
{
    if (!claim_string(region, disk_column.name_offset) || !default_fits(region, disk_column))
        return false;
    p_column->name       = region.p_start + disk_column.name_offset;
    p_column->type       = disk_column.type;
    p_column->qualifier  = disk_column.qualifier;
    p_column->properties = disk_column.properties;
    p_column->sd_defn    = nullptr;
    std::memcpy(&p_column->default_value, disk_column.default_value, sizeof p_column->default_value);
    if (disk_column.sd_defn_offset != 0) {
        if (!claim_definition(region, disk_column.sd_defn_offset))
            return false;
        // In the packed form, which is not that of an rg_sd_def_t and isn't aligned: readers walk it.
        p_column->sd_defn = reinterpret_cast<rg_sd_def_t *>(region.p_start + disk_column.sd_defn_offset);
    }
    return true;
}

// The count of indirect columns is made here and not taken from the file: sizes are computed from it.
[[nodiscard]] kt_int32_t rg_i_convert_metadata_disk_record_to_memory_record(open_t & open)
{
    rg_i_table_t &    table         = open.table;
    const kt_uint32_t total_columns = table.total_columns;
    const kt_uint32_t fixed_length =
        static_cast<kt_uint32_t>(sizeof(rg_i_disk_metadata_record_t) + total_columns * sizeof(rg_disk_column_t));
    region_t region{rg_i_default_data(&table), open.head_at(0).record_length - fixed_length, 0};
    region.spare = region.length;

    std::memcpy(table.p_metadata_record_data, open.at(record_head_length), sizeof(rg_i_metadata_head_t));
    std::memcpy(region.p_start, open.at(fixed_length), region.length);
    const kt_char_t * p_disk_column = open.at(sizeof(rg_i_disk_metadata_record_t));
    // The default data stands ahead of the first name.
    if (!claim_bytes(region, 0, rg_i_load<rg_disk_column_t>(p_disk_column).name_offset))
        return unreadable(RG_HERE);
    for (kt_uint32_t column = 0; column < total_columns; ++column) {
        const auto disk_column = rg_i_load<rg_disk_column_t>(p_disk_column + column * sizeof(rg_disk_column_t));
        if (!convert_column(region, disk_column, &table.p_columns[column]))
            return unreadable(RG_HERE);
        if (rg_i_type_is_indirect(disk_column.type))
            ++table.total_variable_length_columns;
    }
    return 0;
}

// ---- Replay ----

// Where the replay stands: the same record in the file and in the memory image.
struct cursor_t {
    kt_uint32_t                 offset;
    rg_i_disk_record_metadata_t disk_head;
    kt_char_ptr_t               p_memory_record; // its head
    kt_uint32_t                 memory_offset;

    [[nodiscard]] kt_char_ptr_t p_memory_data() const { return p_memory_record + RG_I_RECORD_HEAD_LENGTH; }
};

[[nodiscard]] cursor_t cursor_at(const open_t & open, kt_uint32_t offset, kt_uint32_t memory_offset)
{
    return {offset, open.head_at(offset), open.table.p_metadata_record_data - RG_I_RECORD_HEAD_LENGTH + memory_offset,
            memory_offset};
}

void write_memory_head(const cursor_t & cursor)
{
    rg_i_record_metadata_t head;
    head.record_length     = cursor.disk_head.record_length + RG_I_MEMORY_RECORD_EXCESS;
    head.p_next            = reinterpret_cast<kt_char_ptr_t>(static_cast<uintptr_t>(cursor.disk_head.next_offset));
    head.type              = cursor.disk_head.type;
    head.disk_table_offset = cursor.offset;
    rg_i_store(cursor.p_memory_record, head);
}

void copy_to_memory(const open_t & open, const cursor_t & cursor)
{
    write_memory_head(cursor);
    std::memcpy(cursor.p_memory_data(), open.at(cursor.offset + record_head_length),
                cursor.disk_head.record_length - record_head_length);
}

// A record that has no place in memory. Its data is never copied there.
void free_in_memory(const open_t & open, const cursor_t & cursor)
{
    write_memory_head(cursor);
    rg_i_rb_free_record(&open.table.record_buffer_pool, cursor.p_memory_data());
}

// Notes for each row record where it starts, so that a record that names another needs no walk. Files of new rows alone
// never need it.
[[nodiscard]] kt_int32_t note_row_starts(open_t & open)
{
    open.row_starts.reset(static_cast<kt_char_ptr_t>(std::calloc(open.commit_offset / 8 + 1, 1)));
    if (!open.row_starts)
        return rg_i_fail_no_memory(RG_HERE);
    for (kt_uint32_t offset = open.head_at(0).record_length; offset < open.commit_offset;) {
        const rg_i_disk_record_metadata_t head = open.head_at(offset);
        if (head.type == RG_RECORD_TYPE_ROW) {
            kt_char_t & noted = open.row_starts.get()[offset / 8];
            noted             = static_cast<kt_char_t>(noted | 1 << offset % 8);
        }
        offset += head.record_length;
    }
    return 0;
}

// The slot of the row that one of the earlier row records belongs to. `code` is what a wrong offset is answered with.
[[nodiscard]] kt_int32_t find_row_slot(open_t & open, const cursor_t & cursor, kt_uint32_t named_offset,
                                       kt_int32_t code, kt_uint32_t * p_slot)
{
    if (!open.row_starts)
        if (const kt_int32_t rc = note_row_starts(open); rc != 0)
            return rc;
    if (named_offset >= cursor.offset || (open.row_starts.get()[named_offset / 8] >> named_offset % 8 & 1) == 0)
        return rg_i_fail(RG_HERE, code);
    *p_slot = rg_i_load_u32(open.at(named_offset + offsetof(rg_i_disk_row_record_t, replaces_offset)));
    return 0;
}

[[nodiscard]] kt_int32_t take_new_slot(rg_i_table_t & table, rg_i_index_entry_t ** p_p_entry)
{
    *p_p_entry = rg_i_rows_free_chain_remove(&table);
    if (*p_p_entry == nullptr)
        return unreadable(RG_HERE); // can't be: there is a slot for every record of a row's least length
    ++table.total_applied_rows;
    return 0;
}

// Finds the slot that the version goes to, and frees the version that stands there.
[[nodiscard]] kt_int32_t find_slot_for_row(open_t & open, const cursor_t & cursor, kt_uint32_t replaces_offset,
                                           rg_i_index_entry_t ** p_p_entry)
{
    rg_i_table_t & table = open.table;
    if (replaces_offset == 0)
        return take_new_slot(table, p_p_entry);

    kt_uint32_t slot = 0;
    if (const kt_int32_t rc = find_row_slot(open, cursor, replaces_offset, RG_E_BAD_REPLACES_OFFSET, &slot); rc != 0)
        return rc;
    *p_p_entry = &table.p_rows_fixed_index[slot];
    if ((*p_p_entry)->p_applied == nullptr) {
        // The row was deleted since, and its slot is free: it comes back. Deletions that hit the wrong row make such
        // files.
        rg_i_rows_free_chain_take(&table, *p_p_entry);
        ++table.total_applied_rows;
        return 0;
    }
    rg_i_rb_free_record(&table.record_buffer_pool, (*p_p_entry)->p_applied);
    return 0;
}

// The first data word of a row's record holds the row's slot from here on: in the file's bytes, where later records
// find it, and in memory.
[[nodiscard]] kt_int32_t replay_row(open_t & open, const cursor_t & cursor)
{
    rg_i_table_t & table = open.table;
    if (cursor.disk_head.record_length - record_head_length < rg_i_row_fixed_length(table.total_columns))
        return unreadable(RG_HERE);

    kt_char_ptr_t        p_disk_data = open.at(cursor.offset + record_head_length);
    rg_i_index_entry_t * p_entry     = nullptr;
    if (const kt_int32_t rc = find_slot_for_row(open, cursor, rg_i_load_u32(p_disk_data), &p_entry); rc != 0)
        return rc;

    rg_i_store_u32(p_disk_data, rg_i_fixed_row_index(&table, p_entry));
    copy_to_memory(open, cursor);
    p_entry->p_applied           = cursor.p_memory_data();
    p_entry->p_committed         = cursor.p_memory_data();
    p_entry->file_offset         = cursor.offset;
    p_entry->applied_file_offset = 0;
    p_entry->p_pending_change    = nullptr;
    return 0;
}

[[nodiscard]] kt_int32_t delete_row_at(open_t & open, const cursor_t & cursor, kt_uint32_t named_offset)
{
    rg_i_table_t & table = open.table;
    kt_uint32_t    slot  = 0;
    if (const kt_int32_t rc = find_row_slot(open, cursor, named_offset, RG_E_BAD_DELETED_ROW_OFFSET, &slot); rc != 0)
        return rc;
    rg_i_index_entry_t & entry = table.p_rows_fixed_index[slot];
    if (entry.p_applied != nullptr) {
        rg_i_rb_free_record(&table.record_buffer_pool, entry.p_applied);
        rg_i_rows_free_chain_insert(&table, &entry);
    }
    return 0;
}

[[nodiscard]] kt_int32_t replay_deleted_rows(open_t & open, const cursor_t & cursor)
{
    if (cursor.disk_head.record_length < sizeof(rg_i_disk_deleted_rows_record_t))
        return unreadable(RG_HERE);
    const auto record = rg_i_load<rg_i_disk_deleted_rows_record_t>(open.at(cursor.offset));
    if (record.count > (cursor.disk_head.record_length - sizeof record) / sizeof(kt_uint32_t))
        return unreadable(RG_HERE);

    const kt_char_t * p_offsets = open.at(cursor.offset + static_cast<kt_uint32_t>(sizeof record));
    for (kt_uint32_t i = 0; i < record.count; ++i)
        if (const kt_int32_t rc = delete_row_at(open, cursor, rg_i_load_u32(p_offsets + i * sizeof(kt_uint32_t)));
            rc != 0)
            return rc;

    // Kept because callers depend on it: the count goes off whether each row was still there or not.
    if (record.count > open.table.total_applied_rows)
        return unreadable(RG_HERE);
    open.table.total_applied_rows -= record.count;
    free_in_memory(open, cursor);
    return 0;
}

// Takes the state that the commit record holds, and gives it and all room behind it back to the pool.
[[nodiscard]] kt_int32_t replay_commit_record(open_t & open, const cursor_t & cursor)
{
    rg_i_table_t & table                    = open.table;
    table.commit_record_offset              = cursor.memory_offset;
    table.commit_record_length              = cursor.disk_head.record_length + RG_I_MEMORY_RECORD_EXCESS;
    table.disk_commit_record_offset         = cursor.offset;
    table.disk_commit_record_length         = cursor.disk_head.record_length;
    table.disk_applied_commit_record_offset = cursor.offset;
    table.disk_applied_commit_record_length = cursor.disk_head.record_length;

    copy_to_memory(open, cursor);
    if (const kt_int32_t rc =
            rg_i_open_commit_record(cursor.p_memory_record, table.p_application_metadata, &table.change_counter);
        rc != 0)
        return rc;
    rg_i_record_head(cursor.p_memory_data())->record_length = open.block_length - cursor.memory_offset;
    return rg_i_rb_free_record(&table.record_buffer_pool, cursor.p_memory_data());
}

// Copies each record to its place in memory and follows it, from the second record to the live commit record. The walk
// ahead of this one has seen that all of them lie in the file's bytes.
[[nodiscard]] kt_int32_t replay(open_t & open, kt_uint32_t metadata_record_length)
{
    cursor_t cursor = cursor_at(open, open.head_at(0).record_length, metadata_record_length);
    for (;;) {
        kt_int32_t rc = 0;
        switch (cursor.disk_head.type) {
        case RG_RECORD_TYPE_FREE:
            free_in_memory(open, cursor);
            break;
        case RG_RECORD_TYPE_ROW:
            rc = replay_row(open, cursor);
            break;
        case RG_RECORD_TYPE_DELETED_ROWS:
            rc = replay_deleted_rows(open, cursor);
            break;
        case RG_RECORD_TYPE_COMMIT:
            return replay_commit_record(open, cursor);
        default: // the metadata record stands at the start and nowhere else
            rc = unreadable(RG_HERE);
            break;
        }
        if (rc != 0)
            return rc;
        cursor = cursor_at(open, cursor.offset + cursor.disk_head.record_length,
                           cursor.memory_offset + cursor.disk_head.record_length + RG_I_MEMORY_RECORD_EXCESS);
    }
}

// ---- The table ----

// A slot for every record that is long enough for a row.
[[nodiscard]] kt_int32_t make_rows_index(open_t & open, kt_uint32_t metadata_record_length)
{
    rg_i_table_t &    table        = open.table;
    const kt_uint32_t rows_length  = static_cast<kt_uint32_t>(open.memory_length) - metadata_record_length;
    const kt_uint32_t maximum_rows = rows_length / (table.total_columns * 8 + 20);
    return rg_i_establish_rows_index(&table, maximum_rows != 0 ? maximum_rows : rows_if_none);
}

[[nodiscard]] kt_int32_t build_table(open_t & open)
{
    rg_i_table_t & table                  = open.table;
    kt_uint32_t    metadata_record_length = 0;
    if (const kt_int32_t rc = rg_i_calc_mem_table_size(open, &metadata_record_length); rc != 0)
        return rc;
    if (const kt_int32_t rc = take_image_block(open, metadata_record_length); rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_convert_metadata_disk_record_to_memory_record(open); rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_reserve_room_for_rows(&table); rc != 0)
        return rc;
    if (const kt_int32_t rc = make_rows_index(open, metadata_record_length); rc != 0)
        return rc;
    if (table.p_rows_hash_table == nullptr && table.p_columns[0].type == KT_RSRC_HANDLE_PTR)
        if (const kt_int32_t rc = rg_i_hash_table_open(0, nullptr, nullptr, &table.p_rows_hash_table); rc != 0)
            return rc;
    if (const kt_int32_t rc = rg_i_allocate_application_metadata_buffer(1, &table.p_application_metadata); rc != 0)
        return rc;
    if (const kt_int32_t rc = replay(open, metadata_record_length); rc != 0)
        return rc;
    table.file_length          = static_cast<kt_uint32_t>(open.memory_length);
    table.total_committed_rows = table.total_applied_rows;
    return rg_i_establish_secondary_row_access(&table);
}

[[nodiscard]] kt_int32_t open_table_file(rg_i_table_t & table, kt_char_ptr_t p_name, kt_char_ptr_t p_file_name,
                                         kt_int32_t mode, kt_uint32_t block_size)
{
    if (p_file_name == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    table.p_name = strdup(p_file_name);
    if (table.p_name == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    table.block_size = block_size;
    if (const kt_int32_t rc = rg_i_name_table_file(&table, p_name, p_file_name); rc != 0)
        return rc;
    if (const kt_int32_t rc = open_file(table, mode); rc != 0)
        return rc;
    open_t open{table};
    if (const kt_int32_t rc = read_file(open); rc != 0)
        return rc;
    return build_table(open);
}

} // namespace

kt_int32_t rg_i_open_persistent_table(rg_i_tree_t * p_tree, kt_char_ptr_t p_name, kt_char_ptr_t p_file_name,
                                      kt_int32_t mode, kt_uint32_t block_size, rg_hash_table_t * p_rows_hash_table,
                                      rg_i_table_t ** p_table)
{
    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc = rg_i_create_null_table(&p_new_table); rc != 0) {
        if (p_rows_hash_table != nullptr)
            rg_i_hash_table_close(p_rows_hash_table);
        return rc;
    }
    p_new_table->mode                  = static_cast<kt_uint32_t>(mode);
    p_new_table->implicitly_controlled = (mode & RG_MODE_EXPLICIT_CONTROL) == 0 ? 1 : 0;
    p_new_table->p_rows_hash_table     = p_rows_hash_table;
    p_new_table->p_tree                = p_tree;

    if (const kt_int32_t rc = open_table_file(*p_new_table, p_name, p_file_name, mode, block_size); rc != 0) {
        rg_i_close_table(p_new_table);
        return rc;
    }
    *p_table = p_new_table;
    return 0;
}
