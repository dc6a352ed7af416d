// SPDX-License-Identifier: MIT
// rg_i_gathering_writer: collects records that stand one behind the other in a file, and writes many of them to a call.
// What is queued must stay where it is until it is written.
//
// Each record is an element of the vector, and RG_I_IO_VECTOR_ELEMENTS of them make a call. From the second call on an
// element takes in the records that also lie one behind the other in memory, and a call is made when much is queued:
// what a file system charges for a call is many times what it charges for a record. A builder of records has them lie so
// by filling a buffer, which it may begin anew whenever nothing is queued.
#pragma once

#include "rg_i_table.h"
#include "storage/rg_i_files.h"

struct rg_i_gathering_writer_t {
    struct iovec * p_vector; // RG_I_IO_VECTOR_ELEMENTS of them
    kt_int32_t     fd;
    kt_uint32_t    file_offset; // where the next record goes
    kt_uint32_t    elements = 0;
    ssize_t        bytes    = 0; // queued
    kt_uint32_t    written  = 0;
};

inline constexpr ssize_t RG_I_BYTES_TO_QUEUE = 65536;

// Whether the record lies right behind the last element and may be told in it.
[[nodiscard]] inline bool rg_i_continues_last_element(const rg_i_gathering_writer_t & writer,
                                                      const kt_char_t *               p_record)
{
    if (writer.written == 0 || writer.elements == 0)
        return false;
    const struct iovec & last = writer.p_vector[writer.elements - 1];
    return static_cast<const kt_char_t *>(last.iov_base) + last.iov_len == p_record;
}

inline void rg_i_queue(rg_i_gathering_writer_t & writer, kt_char_ptr_t p_record, kt_uint32_t record_length)
{
    if (rg_i_continues_last_element(writer, p_record)) {
        writer.p_vector[writer.elements - 1].iov_len += record_length;
    } else {
        writer.p_vector[writer.elements] = {p_record, record_length};
        ++writer.elements;
    }
    writer.bytes += record_length;
    writer.file_offset += record_length;
}

[[nodiscard]] inline kt_int32_t rg_i_write_queued(rg_i_gathering_writer_t & writer)
{
    const kt_int32_t rc = rg_i_writev(writer.fd, writer.p_vector, writer.elements, writer.bytes, &writer.written);
    writer.elements     = 0;
    writer.bytes        = 0;
    return rc;
}

[[nodiscard]] inline kt_int32_t rg_i_write_if_full(rg_i_gathering_writer_t & writer)
{
    const bool much_is_queued = writer.written != 0 && writer.bytes >= RG_I_BYTES_TO_QUEUE;
    return writer.elements == RG_I_IO_VECTOR_ELEMENTS || much_is_queued ? rg_i_write_queued(writer) : 0;
}

// Queues a record that was built at *p_p_room, writes if that makes enough, and says where the next one may be built:
// behind it, or, with nothing queued, at the start of the buffer again, which so stays in the caches.
[[nodiscard]] inline kt_int32_t rg_i_queue_built(rg_i_gathering_writer_t & writer, kt_char_ptr_t p_buffer,
                                                 kt_char_ptr_t * p_p_room, kt_uint32_t record_length)
{
    rg_i_queue(writer, *p_p_room, record_length);
    const kt_int32_t rc = rg_i_write_if_full(writer);
    *p_p_room           = writer.elements == 0 ? p_buffer : *p_p_room + record_length;
    return rc;
}
