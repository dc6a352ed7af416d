// SPDX-License-Identifier: MIT
// rg_i_free_record_index: leads to the places of a pool's free chain that walking the chain would lead to.
//
// Layer: memory, below the record pool.
// Always holds: a segment's first free record is exact, and its p_longest is 0 exactly if no free record starts in it.
// All other figures of length are bounds from above, and a bound is never below one that it summarises: a growing
// record raises the bounds over it at once, up to the first that is high enough. A shrinking one leaves them; a search
// that a bound has led astray corrects it. So every correction is paid for by what made it necessary.
// Locking: none; the pool's rules. Searching corrects bounds, so it counts as a change.
// Failure: none. Recursion goes down the tree of blocks, whose depth grows with the logarithm of their number.
#include "rg_i_free_record_index.h"

#include <algorithm>
#include <cassert>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "memory/rg_i_large_pages.h"

#if defined(__SANITIZE_ADDRESS__)
#include <sanitizer/asan_interface.h>
#endif

namespace
{

using block_t  = rg_i_block_index_t;
using node_t   = rg_i_block_node_t;
using index_t  = rg_i_free_record_index_t;
using record_t = rg_i_record_metadata_t;

constexpr kt_uint32_t segment_length = 1024;
constexpr kt_uint32_t fan_out        = 16;
constexpr kt_uint32_t nothing        = UINT32_MAX; // no such segment
constexpr kt_uint32_t none           = 0;          // no such node
constexpr kt_uint32_t most_levels    = 7;          // 16^6 segments are more than a block can have

// Between the records and the index, so that a builder that writes past its block is caught where it does.
#if defined(__SANITIZE_ADDRESS__)
constexpr std::size_t guard_length = 64;
#else
constexpr std::size_t guard_length = 0;
#endif

const record_t * head_at(const kt_char_t * p)
{
    return reinterpret_cast<const record_t *>(p);
}

kt_char_ptr_t start_of(const block_t * p_block)
{
    return reinterpret_cast<kt_char_ptr_t>(p_block->p_block);
}

// Distance of any address from the block's start.
std::uintptr_t offset_in(const block_t * p_block, const kt_char_t * p_address)
{
    return reinterpret_cast<std::uintptr_t>(p_address) - reinterpret_cast<std::uintptr_t>(p_block->p_block);
}

// Whether an address that is a record's, of any block, is one of this block's. The block's own index stands close
// behind its records, so that nothing needs to be read to tell.
bool holds(const block_t * p_block, const kt_char_t * p_address)
{
    return offset_in(p_block, p_address) < offset_in(p_block, reinterpret_cast<const kt_char_t *>(p_block));
}

kt_uint32_t segment_of(const block_t * p_block, const kt_char_t * p_record)
{
    return static_cast<kt_uint32_t>(offset_in(p_block, p_record) / segment_length);
}

bool starts_in_segment(const block_t * p_block, kt_uint32_t segment, const kt_char_t * p_record)
{
    return holds(p_block, p_record) && segment_of(p_block, p_record) == segment;
}

kt_char_ptr_t first_in_segment(const block_t * p_block, kt_uint32_t segment)
{
    if (p_block->p_first[segment] == 0)
        return nullptr;
    return start_of(p_block) + std::size_t{segment} * segment_length + p_block->p_first[segment] - 1;
}

kt_char_ptr_t last_in_segment(const block_t * p_block, kt_uint32_t segment)
{
    kt_char_ptr_t p_record = first_in_segment(p_block, segment);
    while (starts_in_segment(p_block, segment, head_at(p_record)->p_next))
        p_record = head_at(p_record)->p_next;
    return p_record;
}

// ---- The bounds of a block: a tree of fan-out 16 in one array, segments first ----

kt_uint32_t level_above(kt_uint32_t count)
{
    return (count + fan_out - 1) / fan_out;
}

kt_uint32_t count_of_bounds(kt_uint32_t segments)
{
    kt_uint32_t total = segments;
    for (kt_uint32_t count = segments; count > 1; total += count)
        count = level_above(count);
    return total;
}

struct levels_t {
    kt_uint32_t * p_bounds[most_levels];
    kt_uint32_t   count[most_levels];
    kt_uint32_t   top;

    explicit levels_t(const block_t * p_block) : top(0)
    {
        p_bounds[0] = p_block->p_longest;
        count[0]    = p_block->segments;
        while (count[top] > 1) {
            p_bounds[top + 1] = p_bounds[top] + count[top];
            count[top + 1]    = level_above(count[top]);
            ++top;
        }
    }
};

// The bound of the whole block is the last of its bounds.
kt_uint32_t longest_in(const block_t * p_block)
{
    return p_block->p_longest[p_block->bounds - 1];
}

void raise_node_bounds(block_t * p_block, kt_uint32_t length)
{
    node_t * const p_nodes = p_block->p_index->p_nodes;
    kt_uint32_t    n       = p_block->node;
    p_nodes[n].longest     = std::max(p_nodes[n].longest, length);
    for (; n != none && p_nodes[n].longest_in_subtree < length; n = p_nodes[n].parent)
        p_nodes[n].longest_in_subtree = length;
}

void raise_bounds(block_t * p_block, kt_uint32_t segment, kt_uint32_t length)
{
    kt_uint32_t * p_bounds = p_block->p_longest;
    kt_uint32_t   count    = p_block->segments;
    for (kt_uint32_t i = segment; p_bounds[i] < length; i /= fan_out) {
        p_bounds[i] = length;
        if (count == 1) {
            raise_node_bounds(p_block, length);
            return;
        }
        p_bounds += count;
        count = level_above(count);
    }
}

// The walks below go through groups of 16 bounds. A group that a walk came down into is gone through from one end to
// the other, so when nothing was found in it the bound over it was too high, and is corrected.
struct walk_t {
    const levels_t & levels;
    kt_uint32_t      level;
    kt_uint32_t      group;       // first entry of the group
    kt_uint32_t      whole_below; // groups of lower levels are gone through whole

    kt_uint32_t * bounds() const { return levels.p_bounds[level]; }
    kt_uint32_t   group_end() const { return std::min(group + fan_out, levels.count[level]); }

    void go_down(kt_uint32_t entry)
    {
        whole_below = std::max(whole_below, level);
        group       = entry * fan_out;
        --level;
    }
    // The entry over the group; false if there is no level above.
    bool go_up(kt_uint32_t * p_entry)
    {
        if (level == levels.top)
            return false;
        *p_entry = group / fan_out;
        if (level < whole_below)
            levels.p_bounds[level + 1][*p_entry] = *std::max_element(bounds() + group, bounds() + group_end());
        ++level;
        group = *p_entry - *p_entry % fan_out;
        return true;
    }
};

// The first segment from `segment` on whose bound is `length` or more.
kt_uint32_t next_segment(const levels_t & levels, kt_uint32_t segment, kt_uint32_t length)
{
    if (segment >= levels.count[0])
        return nothing;
    // From the start of the block it is quicker to come from above.
    walk_t      walk{levels, segment == 0 ? levels.top : 0, segment - segment % fan_out, 0};
    kt_uint32_t from = segment;
    for (;;) {
        const kt_uint32_t end = walk.group_end();
        while (from < end && walk.bounds()[from] < length)
            ++from;
        if (from < end) {
            if (walk.level == 0)
                return from;
            walk.go_down(from);
            from = walk.group;
        } else {
            if (!walk.go_up(&from))
                return nothing;
            ++from;
        }
    }
}

// The last segment before `segment` in which a free record starts.
kt_uint32_t previous_segment(const levels_t & levels, kt_uint32_t segment)
{
    const bool  from_the_end = segment == levels.count[0];
    walk_t      walk{levels, from_the_end ? levels.top : 0, from_the_end ? 0 : segment - segment % fan_out, 0};
    kt_uint32_t end = from_the_end ? 1 : segment;
    for (;;) {
        while (end > walk.group && walk.bounds()[end - 1] == 0)
            --end;
        if (end > walk.group) {
            if (walk.level == 0)
                return end - 1;
            walk.go_down(end - 1);
            end = walk.group_end();
        } else if (!walk.go_up(&end)) {
            return nothing;
        }
    }
}

kt_char_ptr_t last_free_in(block_t * p_block)
{
    const kt_uint32_t segment = previous_segment(levels_t(p_block), p_block->segments);
    return segment == nothing ? nullptr : last_in_segment(p_block, segment);
}

// The first free record of the block that is long enough; the place's previous record is NULL if it must be looked for.
rg_i_free_place_t first_fit_in(block_t * p_block, kt_uint32_t length)
{
    const levels_t levels(p_block);
    for (kt_uint32_t segment = next_segment(levels, 0, length); segment != nothing;
         segment             = next_segment(levels, segment + 1, length)) {
        kt_uint32_t   longest    = 0;
        kt_char_ptr_t p_previous = nullptr;
        for (kt_char_ptr_t p_record = first_in_segment(p_block, segment); starts_in_segment(p_block, segment, p_record);
             p_record               = head_at(p_record)->p_next) {
            const kt_uint32_t record_length = head_at(p_record)->record_length;
            if (record_length >= length)
                return {p_record, p_previous, p_block};
            longest    = std::max(longest, record_length);
            p_previous = p_record;
        }
        p_block->p_longest[segment] = longest;
    }
    return {};
}

// ---- What stands behind a block ----

std::size_t rounded(std::size_t size)
{
    return (size + 7) / 8 * 8;
}

struct layout_t {
    kt_uint32_t segments;
    kt_uint32_t bounds;
    std::size_t block_index; // offsets from the block's start
    std::size_t longest;
    std::size_t first;
    std::size_t root;

    explicit layout_t(kt_uint32_t total_bytes)
    {
        segments    = total_bytes / segment_length + 1;
        bounds      = count_of_bounds(segments);
        block_index = offset_of_index(total_bytes);
        longest     = block_index + sizeof(block_t);
        first       = longest + std::size_t{bounds} * sizeof(kt_uint32_t);
        root        = rounded(first + std::size_t{segments} * sizeof(kt_uint16_t));
    }
    static std::size_t offset_of_index(kt_uint32_t total_bytes)
    {
        return rounded(std::size_t{total_bytes} + RG_I_RECORD_OVERHANG) + guard_length;
    }
};

// ---- Where blocks come from ----
//
// The blocks of a small pool are allocations of their own. Those of a pool that has grown are carved from pieces of
// whole large pages: its records are read in any order, and with small pages each look at one would cost a miss of the
// address cache besides that of the data. A piece grows with the pool, so that little of it lies unused.

constexpr std::size_t grown_pool     = std::size_t{1} << 20;
constexpr std::size_t largest_piece  = 16 * rg_i_large_page;
constexpr std::size_t cache_line     = 64;
constexpr std::size_t blocks_a_piece = 8; // at least: what is left at the end of one is lost

struct block_memory_t {
    kt_char_ptr_t p_start; // NULL: no memory
    bool          starts_heap_memory;
    bool          is_zero;
};

[[nodiscard]] block_memory_t allocate_block(std::size_t bytes)
{
    auto * const p_start = static_cast<kt_char_ptr_t>(std::calloc(1, bytes));
    if (p_start != nullptr)
        rg_i_prefer_large_pages(p_start, bytes);
    return {p_start, true, true};
}

std::size_t next_piece_length(const index_t * p_index)
{
    const std::size_t wanted = p_index->heap_bytes / 4 / rg_i_large_page * rg_i_large_page;
    return std::clamp(wanted, rg_i_large_page, largest_piece);
}

[[nodiscard]] block_memory_t carve_block(index_t * p_index, std::size_t bytes)
{
    const bool needs_piece = bytes > p_index->room;
    if (needs_piece) {
        const std::size_t length  = next_piece_length(p_index);
        auto * const      p_piece = static_cast<kt_char_ptr_t>(std::aligned_alloc(rg_i_large_page, length));
        if (p_piece == nullptr)
            return allocate_block(bytes); // memory is short, but may do for this block
        rg_i_prefer_large_pages(p_piece, length);
        p_index->p_room = p_piece;
        p_index->room   = length;
    }
    const kt_char_ptr_t p_start = p_index->p_room;
    const std::size_t   taken   = std::min((bytes + cache_line - 1) / cache_line * cache_line, p_index->room);
    p_index->p_room += taken;
    p_index->room -= taken;
    return {p_start, needs_piece, false};
}

[[nodiscard]] block_memory_t find_block_memory(index_t * p_index, std::size_t bytes)
{
    if (p_index == nullptr || p_index->heap_bytes < grown_pool || bytes > next_piece_length(p_index) / blocks_a_piece)
        return allocate_block(bytes);
    return carve_block(p_index, bytes);
}

// ---- The tree of blocks ----

block_t * index_behind(rg_i_record_buffer_t * p_block)
{
    return reinterpret_cast<block_t *>(reinterpret_cast<kt_char_ptr_t>(p_block) +
                                       layout_t::offset_of_index(p_block->total_bytes));
}

block_t * block_at(const node_t & node)
{
    auto * const p_index = node.p_start + layout_t::offset_of_index(node.total_bytes);
    // What stands behind a block is read one thing after the other: have it come at once.
    for (std::size_t line = 0; line < 3; ++line)
        __builtin_prefetch(p_index + line * cache_line);
    return reinterpret_cast<block_t *>(p_index);
}

void correct_subtree_bound(node_t * p_nodes, kt_uint32_t n)
{
    node_t & node = p_nodes[n];
    node.longest_in_subtree =
        std::max({node.longest, p_nodes[node.left].longest_in_subtree, p_nodes[node.right].longest_in_subtree});
}

rg_i_free_place_t first_fit_below(node_t * p_nodes, kt_uint32_t n, kt_uint32_t length)
{
    node_t & node = p_nodes[n];
    if (node.longest_in_subtree < length)
        return {};
    if (const rg_i_free_place_t place = first_fit_below(p_nodes, node.left, length); place.p_record != nullptr)
        return place;
    if (node.longest >= length) {
        block_t * const p_block = block_at(node);
        if (const rg_i_free_place_t place = first_fit_in(p_block, length); place.p_record != nullptr)
            return place;
        node.longest = longest_in(p_block);
    }
    if (const rg_i_free_place_t place = first_fit_below(p_nodes, node.right, length); place.p_record != nullptr)
        return place;
    correct_subtree_bound(p_nodes, n);
    return {};
}

kt_char_ptr_t last_free_at(node_t & node)
{
    if (node.longest == 0)
        return nullptr;
    block_t * const     p_block  = block_at(node);
    const kt_char_ptr_t p_record = last_free_in(p_block);
    if (p_record == nullptr)
        node.longest = longest_in(p_block);
    return p_record;
}

kt_char_ptr_t last_free_below(node_t * p_nodes, kt_uint32_t n)
{
    node_t & node = p_nodes[n];
    if (node.longest_in_subtree == 0)
        return nullptr;
    if (const kt_char_ptr_t p_record = last_free_below(p_nodes, node.right); p_record != nullptr)
        return p_record;
    if (const kt_char_ptr_t p_record = last_free_at(node); p_record != nullptr)
        return p_record;
    if (const kt_char_ptr_t p_record = last_free_below(p_nodes, node.left); p_record != nullptr)
        return p_record;
    correct_subtree_bound(p_nodes, n);
    return nullptr;
}

kt_char_ptr_t last_free_in_blocks_before(const block_t * p_block)
{
    node_t * const p_nodes = p_block->p_index->p_nodes;
    kt_uint32_t    n       = p_block->node;
    if (const kt_char_ptr_t p_record = last_free_below(p_nodes, p_nodes[n].left); p_record != nullptr)
        return p_record;
    for (kt_uint32_t parent = p_nodes[n].parent; parent != none; n = parent, parent = p_nodes[n].parent) {
        if (p_nodes[parent].right != n)
            continue;
        if (const kt_char_ptr_t p_record = last_free_at(p_nodes[parent]); p_record != nullptr)
            return p_record;
        if (const kt_char_ptr_t p_record = last_free_below(p_nodes, p_nodes[parent].left); p_record != nullptr)
            return p_record;
    }
    return nullptr;
}

// No node stands below one with a lower priority. They are scattered, so that the tree is even in whatever order the
// heap hands out addresses.
kt_uint64_t priority_of(const node_t & node)
{
    kt_uint64_t mixed = reinterpret_cast<std::uintptr_t>(node.p_start);
    mixed             = (mixed ^ (mixed >> 33)) * 0xff51afd7ed558ccdull;
    mixed             = (mixed ^ (mixed >> 33)) * 0xc4ceb9fe1a85ec53ull;
    return mixed ^ (mixed >> 33);
}

// Lets a node and its parent change places.
void rotate_up(index_t * p_index, kt_uint32_t n)
{
    node_t * const    p_nodes     = p_index->p_nodes;
    node_t &          node        = p_nodes[n];
    const kt_uint32_t parent      = node.parent;
    const kt_uint32_t grandparent = p_nodes[parent].parent;
    const bool        is_left     = p_nodes[parent].left == n;
    kt_uint32_t &     inner       = is_left ? node.right : node.left;

    (is_left ? p_nodes[parent].left : p_nodes[parent].right) = inner;
    if (inner != none)
        p_nodes[inner].parent = parent;
    inner                  = parent;
    p_nodes[parent].parent = n;
    node.parent            = grandparent;
    if (grandparent == none)
        p_index->root = n;
    else
        (p_nodes[grandparent].left == parent ? p_nodes[grandparent].left : p_nodes[grandparent].right) = n;

    node.longest_in_subtree = p_nodes[parent].longest_in_subtree;
    correct_subtree_bound(p_nodes, parent);
}

void enter_into_tree(index_t * p_index, kt_uint32_t n)
{
    node_t * const p_nodes = p_index->p_nodes;
    kt_uint32_t *  p_link  = &p_index->root;
    while (*p_link != none) {
        p_nodes[n].parent = *p_link;
        p_link = p_nodes[n].p_start < p_nodes[*p_link].p_start ? &p_nodes[*p_link].left : &p_nodes[*p_link].right;
    }
    *p_link = n;
    while (p_nodes[n].parent != none && priority_of(p_nodes[p_nodes[n].parent]) < priority_of(p_nodes[n]))
        rotate_up(p_index, n);
}

[[nodiscard]] bool make_room_for_a_node(index_t * p_index)
{
    if (p_index->node_count < p_index->node_capacity)
        return true;
    const std::size_t capacity = std::size_t{p_index->node_capacity} * 2;
    auto * const      p_nodes  = static_cast<node_t *>(std::malloc(capacity * sizeof(node_t)));
    if (p_nodes == nullptr)
        return false;
    std::memcpy(p_nodes, p_index->p_nodes, p_index->node_count * sizeof(node_t));
    rg_i_drop_index(p_index);
    p_index->p_nodes       = p_nodes;
    p_index->node_capacity = static_cast<kt_uint32_t>(capacity);
    return true;
}

index_t * start_index(kt_char_ptr_t p_memory)
{
    auto * const p_index   = reinterpret_cast<index_t *>(p_memory);
    p_index->p_nodes       = p_index->first_nodes;
    p_index->node_count    = 1; // the one that stands for none
    p_index->node_capacity = RG_I_FIRST_BLOCK_NODES;
    return p_index;
}

} // namespace

rg_i_block_index_t * rg_i_make_indexed_block(rg_i_free_record_index_t ** p_p_index, kt_uint32_t total_bytes)
{
    const bool first_of_pool = *p_p_index == nullptr;
    if (!first_of_pool && !make_room_for_a_node(*p_p_index))
        return nullptr;
    const layout_t       layout(total_bytes);
    const std::size_t    bytes  = layout.root + (first_of_pool ? sizeof(index_t) : 0);
    const block_memory_t memory = find_block_memory(*p_p_index, bytes);
    if (memory.p_start == nullptr)
        return nullptr;

    // Nothing below fails.
    const kt_char_ptr_t p_start = memory.p_start;
    if (!memory.is_zero)
        std::memset(p_start + total_bytes, 0, bytes - total_bytes);
#if defined(__SANITIZE_ADDRESS__)
    const std::size_t readable = std::size_t{total_bytes} + RG_I_RECORD_OVERHANG;
    ASAN_POISON_MEMORY_REGION(p_start + readable, layout.block_index - readable);
#endif
    if (first_of_pool)
        *p_p_index = start_index(p_start + layout.root);
    index_t * const   p_index = *p_p_index;
    const kt_uint32_t n       = p_index->node_count++;
    p_index->p_nodes[n]       = {p_start, total_bytes, none, none, none, 0, 0};
    p_index->heap_bytes += bytes;

    auto * const p_block = reinterpret_cast<block_t *>(p_start + layout.block_index);
    p_block->p_block     = reinterpret_cast<rg_i_record_buffer_t *>(p_start);
    p_block->p_index     = p_index;
    p_block->p_longest   = reinterpret_cast<kt_uint32_t *>(p_start + layout.longest);
    p_block->p_first     = reinterpret_cast<kt_uint16_t *>(p_start + layout.first);
    p_block->segments    = layout.segments;
    p_block->bounds      = layout.bounds;
    p_block->clean_from  = memory.is_zero ? RG_I_RECORD_BUFFER_HEAD_LENGTH : total_bytes;
    p_block->node        = n;

    p_block->starts_heap_memory   = memory.starts_heap_memory;
    p_block->p_block->p_next      = nullptr;
    p_block->p_block->total_bytes = total_bytes;
    enter_into_tree(p_index, n);
    return p_block;
}

void rg_i_drop_index(rg_i_free_record_index_t * p_index)
{
    if (p_index != nullptr && p_index->p_nodes != p_index->first_nodes)
        std::free(p_index->p_nodes);
}

void rg_i_free_blocks(rg_i_record_buffer_t * p_first)
{
    // A piece is freed when the walk has come to the next one: the blocks carved from it follow its first one.
    rg_i_record_buffer_t * p_piece = p_first;
    for (rg_i_record_buffer_t * p_block = p_first; p_block != nullptr; p_block = p_block->p_next) {
        if (p_block == p_piece || !index_behind(p_block)->starts_heap_memory)
            continue;
        std::free(p_piece);
        p_piece = p_block;
    }
    std::free(p_piece);
}

rg_i_block_index_t * rg_i_block_of(rg_i_free_record_index_t * p_index, const kt_char_t * p_address)
{
    block_t * p_block = p_index->p_recent;
    if (p_block != nullptr && holds(p_block, p_address))
        return p_block;
    const node_t * const p_nodes = p_index->p_nodes;
    kt_uint32_t          n       = p_index->root;
    while (n != none && (p_address < p_nodes[n].p_start || p_address >= p_nodes[n].p_start + p_nodes[n].total_bytes))
        n = p_address < p_nodes[n].p_start ? p_nodes[n].left : p_nodes[n].right;
    if (n == none)
        return nullptr;
    p_index->p_recent = block_at(p_nodes[n]);
    return p_index->p_recent;
}

rg_i_free_place_t rg_i_first_fit(rg_i_free_record_index_t * p_index, kt_uint32_t record_length)
{
    rg_i_free_place_t & hint        = p_index->hint;
    const bool          hint_serves = hint.p_record != nullptr && record_length >= p_index->hint_length &&
                             head_at(hint.p_record)->record_length >= record_length;
    if (!hint_serves) {
        const rg_i_free_place_t found = first_fit_below(p_index->p_nodes, p_index->root, record_length);
        if (found.p_record == nullptr)
            return {};
        if (found.p_record != hint.p_record) {
            hint                         = found;
            p_index->hint_length         = record_length;
            p_index->hint_previous_known = found.p_previous != nullptr;
        }
        p_index->hint_length = std::min(p_index->hint_length, record_length);
    }
    if (hint.p_block == nullptr)
        hint.p_block = rg_i_block_of(p_index, hint.p_record);
    if (!p_index->hint_previous_known) {
        hint.p_previous              = rg_i_last_free_before(hint.p_block, hint.p_record);
        p_index->hint_previous_known = true;
    }
    return hint;
}

kt_char_ptr_t rg_i_last_free_before(rg_i_block_index_t * p_block, const kt_char_t * p_address)
{
    const kt_uint32_t segment  = segment_of(p_block, p_address);
    kt_char_ptr_t     p_record = first_in_segment(p_block, segment);
    if (p_record != nullptr && p_record < p_address) {
        while (starts_in_segment(p_block, segment, head_at(p_record)->p_next) && head_at(p_record)->p_next < p_address)
            p_record = head_at(p_record)->p_next;
        return p_record;
    }
    const kt_uint32_t before = previous_segment(levels_t(p_block), segment);
    return before != nothing ? last_in_segment(p_block, before) : last_free_in_blocks_before(p_block);
}

kt_char_ptr_t rg_i_first_free_in(rg_i_block_index_t * p_block)
{
    const kt_uint32_t segment = next_segment(levels_t(p_block), 0, 1);
    return segment == nothing ? nullptr : first_in_segment(p_block, segment);
}

void rg_i_note_free(rg_i_block_index_t * p_block, kt_char_ptr_t p_record)
{
    const kt_uint32_t segment = segment_of(p_block, p_record);
    const auto        place   = static_cast<kt_uint16_t>(offset_in(p_block, p_record) % segment_length + 1);
    if (p_block->p_first[segment] == 0 || place < p_block->p_first[segment])
        p_block->p_first[segment] = place;
    rg_i_note_grown(p_block, p_record);
}

void rg_i_note_grown(rg_i_block_index_t * p_block, kt_char_ptr_t p_record)
{
    raise_bounds(p_block, segment_of(p_block, p_record), head_at(p_record)->record_length);
}

void rg_i_note_gone(rg_i_block_index_t * p_block, kt_char_ptr_t p_record, kt_char_ptr_t p_next)
{
    const kt_uint32_t segment = segment_of(p_block, p_record);
    if (first_in_segment(p_block, segment) != p_record)
        return;
    if (starts_in_segment(p_block, segment, p_next)) {
        p_block->p_first[segment] = static_cast<kt_uint16_t>(offset_in(p_block, p_next) % segment_length + 1);
    } else {
        p_block->p_first[segment]   = 0;
        p_block->p_longest[segment] = 0;
    }
}

void rg_i_move_hint_after_taking(rg_i_free_record_index_t * p_index, kt_char_ptr_t p_taken, kt_char_ptr_t p_previous,
                                 kt_char_ptr_t p_rest, kt_char_ptr_t p_next)
{
    rg_i_free_place_t & hint = p_index->hint;
    if (hint.p_record == p_taken) {
        hint.p_record                = p_rest != nullptr ? p_rest : p_next;
        hint.p_previous              = p_previous;
        p_index->hint_previous_known = true;
        if (hint.p_block != nullptr && !holds(hint.p_block, hint.p_record))
            hint.p_block = nullptr; // the next one is in another block
    } else if (hint.p_previous == p_taken) {
        hint.p_previous = p_rest != nullptr ? p_rest : p_previous;
    }
}

void rg_i_move_hint_after_freeing(rg_i_free_record_index_t * p_index, const rg_i_free_place_t & freed,
                                  bool previous_known, kt_char_ptr_t p_absorbed)
{
    rg_i_free_place_t & hint = p_index->hint;
    if (hint.p_record == nullptr)
        return;
    const bool swallowed = p_absorbed == hint.p_record;
    const bool fits_now =
        freed.p_record < hint.p_record && head_at(freed.p_record)->record_length >= p_index->hint_length;
    if (swallowed || fits_now) {
        hint                         = freed;
        p_index->hint_previous_known = previous_known;
    } else if (head_at(freed.p_record)->p_next == hint.p_record) {
        hint.p_previous              = freed.p_record;
        p_index->hint_previous_known = true;
    }
}
