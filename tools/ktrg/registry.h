// SPDX-License-Identifier: MIT
// registry: the library's trees and tables with an owner, and failures instead of codes.
//
// A tree of ours mounts one directory at place.h's mount point. Reading opens read-only, takes no lock and never waits.
// Writing asks first whether another process holds the table (hold.h), and makes sure that the file it got is still the
// table's, for a writer may have put a new file in its place while we waited.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "columns.h"
#include "key_hash.h"
#include "kt_rg.h"
#include "talk.h"
#include "tree.h"

namespace ktrg
{

// The values of one row, in the order of the columns asked for. What is stored indirectly belongs to the record.
class row_values
{
  public:
    explicit row_values(const std::vector<column> & columns);
    ~row_values() { release(); }
    row_values(const row_values &)             = delete;
    row_values & operator=(const row_values &) = delete;

    [[nodiscard]] const std::vector<column> & columns() const { return columns_; }
    [[nodiscard]] const kt_value_t &          operator[](std::size_t i) const { return values_[i]; }
    void                                      release();

  private:
    friend class table;
    std::vector<column>        columns_;
    std::vector<kt_char_ptr_t> names_;
    std::vector<kt_value_t>    values_;
    std::vector<kt_value_t *>  addresses_;
};

class table
{
  public:
    // For reading. `hashed` builds an index of the keys at the open: for more lookups than a few.
    static table open_for_reading(const place & where, bool hashed = false);
    // For writing, in explicit control: apply and commit are the caller's. Waits up to so many seconds for a process
    // that holds the table.
    static table open_for_writing(const place & where, double wait_seconds);
    // A new table with its file, or one in memory only.
    static table create(const place & where, const std::vector<column> & columns, std::uint64_t expected_rows);
    static table create_in_memory(const place & where, const std::vector<column> & columns,
                                  std::uint64_t expected_rows);

    // A table of a packed buffer, in memory and for reading, under the place's registry path. What the library refuses is
    // a failure of exit code 4.
    static table from_packed(const place & where, void * p_buffer, kt_uint32_t index, const key_hash & hash);

    table(table && other) noexcept;
    table & operator=(table &&) = delete;
    ~table();

    [[nodiscard]] const place &               where() const { return where_; }
    [[nodiscard]] const std::vector<column> & columns() const { return columns_; }
    [[nodiscard]] rg_opaque_handle_t          handle() const { return handle_; }
    [[nodiscard]] const tree &                tree_of() const { return tree_; }

    // The change counter, and the number of rows, as of the open.
    [[nodiscard]] std::uint64_t counter() const { return counter_; }
    [[nodiscard]] std::uint64_t count() const { return rows_; }

    // Reads the row at a position among the committed rows; false behind the last.
    bool read(std::uint64_t position, row_values & values) const;
    // Reads the row with a fixed index, as matching() gives them.
    void read_fixed(kt_uint32_t row, row_values & values) const;
    // Reads the row with the key; false if there is none.
    bool read_by_key(kt_value_t key, row_values & values) const;
    // The fixed indices of the rows that the expression is true of. Refuses a wrong one with a picture of the place.
    [[nodiscard]] std::vector<kt_uint32_t> matching(const std::string & expression) const;

    // Returns the code of the registry, since the caller knows which of its rows it was.
    [[nodiscard]] kt_int32_t add(const std::vector<kt_char_ptr_t> & names,
                                 const std::vector<kt_value_t *> &  values) const;

    // Sets columns of the row with the key.
    [[nodiscard]] kt_int32_t set(kt_value_t key, const std::vector<kt_char_ptr_t> & names,
                                 const std::vector<kt_value_t *> & values) const;
    [[nodiscard]] bool       contains(kt_value_t key) const;
    // Deletes the row at a position. Positions stay what they are until the commit.
    void delete_at(std::uint64_t position) const;
    // Deletes the rows that the expression is true of, and returns how many.
    [[nodiscard]] std::size_t delete_matching(const std::string & expression) const;
    // Deletes them all.
    void delete_all() const;

    // The application's blob, as committed; none if there is none.
    [[nodiscard]] std::optional<std::vector<unsigned char>> blob() const;
    void                                                    set_blob(const std::vector<unsigned char> & blob) const;

    // Makes all that is pending permanent, in one transaction. The change counter becomes `counter`, or one more than it
    // was for 0.
    void commit(std::uint64_t counter = 0);
    // Commits and closes; a dry run drops what is pending instead.
    void finish(bool dry_run);
    // Gives the table back. What isn't committed is gone.
    void close();
    // Removes the table's file, and closes it.
    void drop();
    // The same for a table that create() made, in a failure that matters more than this one.
    void remove();

  private:
    explicit table(place where) : where_(std::move(where)) {}
    void open(kt_int32_t mode, bool hashed);
    void take_metadata();
    void take_counts();
    void tell_open(const char * p_what, const stopwatch & time) const;
    void make(const std::string & registry_path, const std::vector<column> & columns, std::uint64_t expected_rows);

    place               where_;
    std::vector<column> columns_;
    std::uint64_t       counter_ = 0;
    std::uint64_t       rows_    = 0;
    tree                tree_;
    rg_opaque_handle_t  handle_ = nullptr;
};

} // namespace ktrg
