// SPDX-License-Identifier: MIT
// tables: the tables that are measured, and how they come to be.
#ifndef GROWTH_TABLES_H
#define GROWTH_TABLES_H

#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "common/kt_rg_rows.h"
#include "curves.h"

namespace growth
{

constexpr kt_int32_t explicit_control = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// A path as calls take it.
inline kt_char_ptr_t path(const char * p_path)
{
    return const_cast<kt_char_ptr_t>(p_path);
}

void apply_and_commit(rg_opaque_handle_t table);

// A table of the five columns, without rows.
rg_opaque_handle_t create(rg_opaque_handle_t tree, const char * p_path, std::size_t rows, bool hashed);
// Adds rows with the ids from first on, as they come or with notes of any length, and commits them.
void load(rg_opaque_handle_t table, std::uint64_t first, std::size_t total, bool any_length);

std::size_t rows_of(rg_opaque_handle_t table);
// The fixed indices of the rows that match.
std::vector<std::uint32_t> list(rg_opaque_handle_t table, const char * p_criteria, ...);

// n different numbers below total, one by one, in an order without a pattern.
class scattered
{
  public:
    explicit scattered(std::size_t total);
    std::size_t next();

  private:
    std::size_t total_;
    std::size_t step_;
    std::size_t at_;
};

// Rows to work on, chosen at random, in an order that no cache foresees; begins anew at the end.
template <class T> class sample
{
  public:
    explicit sample(std::vector<T> values) : values_(std::move(values)) {}
    T next()
    {
        at_ = at_ + 1 < values_.size() ? at_ + 1 : 0;
        return values_[at_];
    }

  private:
    std::vector<T> values_;
    std::size_t    at_ = 0;
};

// A table in memory, alone in its tree, with so many rows in it: fresh, or after
//   - rows were added beyond their final number, with notes of 0 to 120 bytes,
//   - twice a quarter of the rows was deleted at random, an eighth set to notes of other lengths, and as many added,
//   - the rows beyond the number were deleted at random, so that their slots are free.
class table_in_memory
{
  public:
    table_in_memory(std::size_t rows, state s, bool hashed);
    ~table_in_memory();
    table_in_memory(const table_in_memory &)             = delete;
    table_in_memory & operator=(const table_in_memory &) = delete;

    [[nodiscard]] rg_opaque_handle_t tree() const { return tree_; }
    [[nodiscard]] rg_opaque_handle_t handle() const { return table_; }
    [[nodiscard]] state              how() const { return state_; }
    [[nodiscard]] std::size_t        rows() const { return rows_; }
    std::uint64_t                    new_id() { return next_id_++; }

    [[nodiscard]] sample<std::uint32_t> fixed_indices() const;
    [[nodiscard]] sample<std::uint32_t> packed_indices() const;
    [[nodiscard]] sample<std::uint64_t> keys() const;

    static constexpr const char * name = "/rows";

  private:
    void churn();
    void delete_some(std::size_t total);
    void set_some(std::size_t total);

    std::size_t        rows_;
    state              state_;
    rg_opaque_handle_t tree_    = nullptr;
    rg_opaque_handle_t table_   = nullptr;
    std::uint64_t      next_id_ = 0;
};

// The C library's allocator sorts what was freed when it is next asked for something larger, ten thousand pieces at a
// time. After millions of pieces that takes seconds, which belong to the call that freed them and not to what is measured
// next: this does it.
void settle_heap();

// A text of any length between 0 and 120 bytes, another for each seed; the same for the same one. Good until the next.
kt_char_ptr_t any_note(std::uint64_t seed);

} // namespace growth

#endif
