// SPDX-License-Identifier: MIT
// rg_x_open_tree: makes a tree, and on the first call of a process what the process needs: the fork handler and the
// registration for trace.
//
// Layer: frame, exported. Departs from the standard frames: a forked child may open trees, and no update is held up.
// Always holds: a tree that was handed out stands in P_Registry_Trees until it is closed.
// Locking: Registry_Trees_Mutex for the insertion alone; it is a leaf.
// Failure: the new tree is torn down, and *tree_handle isn't touched.
#undef NDEBUG // for the assertion in rg_reg_once, which has to hold in every build
#include <cassert>
#include <cstdlib>

#include "rg_i_call_frame.h"

void *          P_Registry_Trees;
pthread_mutex_t Registry_Trees_Mutex = PTHREAD_MUTEX_INITIALIZER;
pthread_mutex_t ForkMutex            = PTHREAD_MUTEX_INITIALIZER;
kt_uint32_t     In_Child_Process;
pthread_once_t  ForkHandlersAreEstablished = PTHREAD_ONCE_INIT;

namespace
{

constexpr char module_version[] = "rg_x_open_tree 1.0";

// Ends the process where a child couldn't be told from its parent: both would write to the same files.
void rg_reg_once()
{
    if (pthread_atfork(nullptr, nullptr, ForkChildHandler) != 0)
        __assert_fail("0 == pthread_atfork(((void *)0), ((void *)0), ForkChildHandler)", __FILE_NAME__, __LINE__,
                      __func__);
}

// Without tables and mount points, and without the conversion handles.
[[nodiscard]] rg_i_tree_t * make_empty_tree()
{
    auto * p_tree = static_cast<rg_i_tree_t *>(std::malloc(sizeof(rg_i_tree_t)));
    if (p_tree == nullptr)
        return nullptr;
    p_tree->p_tables                              = nullptr;
    p_tree->p_unnamed_tables                      = nullptr;
    p_tree->p_mount_points                        = nullptr;
    p_tree->p_to_table_string_conversion_handle   = nullptr;
    p_tree->p_from_table_string_conversion_handle = nullptr;
    rg_i_rw_open(&p_tree->lock);
    return p_tree;
}

[[nodiscard]] kt_int32_t enter_among_trees(rg_i_tree_t * p_tree)
{
    mutex_guard trees_lock(Registry_Trees_Mutex);
    if (trees_lock.code() != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_lock", trees_lock.code());
    if (tsearch(p_tree, &P_Registry_Trees, rg_i_pointer_compare) == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    return 0;
}

[[nodiscard]] kt_int32_t complete_tree(rg_i_tree_t * p_tree)
{
    if (const kt_int32_t rc = rg_i_get_string_conversion_handles(&p_tree->p_to_table_string_conversion_handle,
                                                                 &p_tree->p_from_table_string_conversion_handle);
        rc != 0)
        return rc;
    return enter_among_trees(p_tree);
}

[[nodiscard]] kt_int32_t open_tree(rg_opaque_handle_t * tree_handle)
{
    if (tree_handle == nullptr)
        return rg_i_fail(RG_HERE, RG_E_INVALID_HANDLE);

    rg_i_tree_t * p_tree = make_empty_tree();
    if (p_tree == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    if (const kt_int32_t rc = complete_tree(p_tree); rc != 0) {
        static_cast<void>(rg_i_close_tree(p_tree));
        return rc;
    }
    *tree_handle = p_tree;
    return 0;
}

} // namespace

void ForkChildHandler(void)
{
    In_Child_Process = 1;
}

// Kept because callers depend on it: number_of_retries and timeout have no effect, and a NULL tree_handle counts as a
// bad handle, after the process has been made ready.
extern "C" kt_int32_t rg_open_tree_1(rg_opaque_handle_t * tree_handle, kt_uint32_t, kt_uint64_t)
{
    rg_i_trace_entry(entry_id::open_tree);
    pthread_once(&ForkHandlersAreEstablished, rg_reg_once);
    rg_i_register_for_trace();
    return rg_i_finish_call(entry_id::open_tree, open_tree(tree_handle));
}
