// SPDX-License-Identifier: MIT
// rg_i_kept_blocks: keeps the blocks of a pool alive for those whose records lead into them.
//
// Layer: memory, beside the record pool.
// Always holds: while the pool stands, it counts as a holder itself and the blocks are its own; when it goes with
// others left, the blocks pass to the shared object, and the last one to let go frees both. Nothing in kept blocks
// changes. Locking: none; the count is atomic, since pool and holders belong to tables with locks of their own.
// Failure: only the first sharing of a pool allocates.
#include <atomic>
#include <cstdlib>
#include <utility>

#include "frame/rg_i_trace.h"
#include "memory/rg_i_free_record_index.h"
#include "rg_i_record_buffer_pool.h"

struct rg_i_kept_blocks_t {
    kt_uint32_t            holders; // the pool, while it stands, and everybody else; changed atomically
    rg_i_record_buffer_t * p_first; // the blocks, once the pool has gone
};

namespace
{

constexpr char module_version[] = "rg_i_kept_blocks 1.0";

} // namespace

kt_int32_t rg_i_rb_share_blocks(rg_i_record_buffer_pool_t * p_record_buffer_pool, rg_i_kept_blocks_t ** p_p_kept_blocks)
{
    if (p_record_buffer_pool->p_kept_blocks == nullptr) {
        auto * const p_kept_blocks = static_cast<rg_i_kept_blocks_t *>(std::malloc(sizeof(rg_i_kept_blocks_t)));
        if (p_kept_blocks == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
        *p_kept_blocks                      = {1, nullptr};
        p_record_buffer_pool->p_kept_blocks = p_kept_blocks;
    }
    rg_i_rb_hold_blocks(p_record_buffer_pool->p_kept_blocks);
    *p_p_kept_blocks = p_record_buffer_pool->p_kept_blocks;
    return 0;
}

void rg_i_rb_hold_blocks(rg_i_kept_blocks_t * p_kept_blocks)
{
    std::atomic_ref(p_kept_blocks->holders).fetch_add(1, std::memory_order_relaxed);
}

void rg_i_rb_let_go_of_blocks(rg_i_kept_blocks_t * p_kept_blocks)
{
    if (p_kept_blocks == nullptr ||
        std::atomic_ref(p_kept_blocks->holders).fetch_sub(1, std::memory_order_acq_rel) != 1)
        return;
    rg_i_free_blocks(p_kept_blocks->p_first);
    std::free(p_kept_blocks);
}

void rg_i_rb_give_up_blocks(rg_i_record_buffer_pool_t * p_record_buffer_pool)
{
    rg_i_record_buffer_t * const p_first       = std::exchange(p_record_buffer_pool->p_first_record_buffer, nullptr);
    rg_i_kept_blocks_t * const   p_kept_blocks = std::exchange(p_record_buffer_pool->p_kept_blocks, nullptr);
    if (p_kept_blocks == nullptr) {
        rg_i_free_blocks(p_first);
    } else {
        p_kept_blocks->p_first = p_first; // only the pool itself writes this, while it still counts as a holder
        rg_i_rb_let_go_of_blocks(p_kept_blocks);
    }
    rg_i_rb_let_go_of_blocks(std::exchange(p_record_buffer_pool->p_lender, nullptr));
}
