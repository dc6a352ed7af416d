// SPDX-License-Identifier: MIT
// rg_i_gathering_writer: collects records that stand one behind the other in a file, and writes them
// RG_I_IO_VECTOR_ELEMENTS at a time. What is queued must stay where it is until it is written.
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

inline void rg_i_queue(rg_i_gathering_writer_t & writer, kt_char_ptr_t p_record, kt_uint32_t record_length)
{
    writer.p_vector[writer.elements] = {p_record, record_length};
    ++writer.elements;
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
    return writer.elements == RG_I_IO_VECTOR_ELEMENTS ? rg_i_write_queued(writer) : 0;
}
