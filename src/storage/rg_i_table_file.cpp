// SPDX-License-Identifier: MIT
// rg_i_table_file: the names of a persistent table, and the end of a rewrite file.
//
// Layer: storage. Called by creation, open, apply, commit and abort.
// Always holds: the data path and the rewrite path are one buffer, in which only the byte at file_path_length differs.
// Locking: the caller holds the table's write lock, or no other thread can see the table yet.
// Failure: only memory can run out.
#include "storage/rg_i_table_file.h"

#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_table_file 1.0";

constexpr kt_char_t rewrite_suffix[] = ".rewrite";

} // namespace

kt_int32_t rg_i_name_table_file(rg_i_table_t * p_table, const kt_char_t * p_registry_path,
                                const kt_char_t * p_file_name)
{
    const size_t path_length  = std::strlen(p_file_name);
    p_table->file_path_length = static_cast<kt_uint32_t>(path_length);
    p_table->p_file_path      = static_cast<kt_char_ptr_t>(std::malloc(path_length + sizeof rewrite_suffix));
    if (p_table->p_file_path == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(p_table->p_file_path, p_file_name, path_length);
    std::memcpy(p_table->p_file_path + path_length, rewrite_suffix, sizeof rewrite_suffix);

    if (p_registry_path != nullptr) {
        p_table->p_persistent_table_registry_path = strdup(p_registry_path);
        if (p_table->p_persistent_table_registry_path == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
    }
    return 0;
}

void rg_i_give_up_rewrite_file(rg_i_table_t * p_table)
{
    close(p_table->rewrite_file_fd);
    p_table->rewrite_file_fd = -1;
    unlink(rg_i_set_rewrite_path(p_table));
}
