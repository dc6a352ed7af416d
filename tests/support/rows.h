// SPDX-License-Identifier: MIT
// rows: what the tests of the row operations stand on: a table of each kind, short forms of the reads and updates, and
// a picture of a table's whole state, for showing that a refused call changed nothing.
#pragma once

#include <gtest/gtest.h>

#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "rg_i_table.h"
#include "support/registry.h"

namespace kt_test
{

inline rg_i_table_t & object_of(rg_opaque_handle_t table)
{
    return *static_cast<rg_i_table_t *>(table);
}

inline rg_i_index_entry_t & slot_of(rg_opaque_handle_t table, kt_uint32_t fixed_index)
{
    return object_of(table).p_rows_fixed_index[fixed_index];
}

// ---- A picture of a table ----

struct table_picture {
    std::vector<const void *> slots; // the two records of each slot that is in use, by slot
    std::vector<kt_uint32_t>  packed_index;
    std::vector<kt_uint32_t>  updated; // fixed indices on the rows list, in order
    std::vector<kt_uint32_t>  deleted; // and on the delete list
    std::vector<kt_uint32_t>  hashed;  // bucket and row of each element, in order
    kt_uint32_t               applied_rows                            = 0;
    kt_uint32_t               committed_rows                          = 0;
    kt_uint32_t               applied_deletions                       = 0;
    kt_uint32_t               ready_for_commit                        = 0;
    kt_uint32_t               taken_bytes                             = 0; // of the records that are in use
    bool                      operator==(const table_picture &) const = default;
};

// Also checks what must always hold: records tile their blocks, the free chain is exactly the free records in ascending
// order, the free slots are exactly the chain's.
table_picture picture_of(rg_opaque_handle_t table);

// Whether the room that the pool hands out as zeroed is zero, whatever was built in it and given up before.
bool free_room_is_zero(rg_opaque_handle_t table);

// ---- Short forms ----

struct reading {
    kt_int32_t     rc = -1;
    kt_value_t     value{};
    rg_row_state_t state = 99; // 99: not delivered
};

reading read_fixed(rg_opaque_handle_t table, kt_uint32_t fixed_index, const std::string & column,
                   kt_uint32_t visible = 0);
reading read_packed(rg_opaque_handle_t table, kt_uint32_t packed_index, const std::string & column,
                    kt_uint32_t visible = 0);
reading read_key(rg_opaque_handle_t table, kt_value_t key, const std::string & column, kt_uint32_t visible = 0);

// The string that was read, which is freed; "<code>" if the read failed.
std::string taken_string(const reading & r);

kt_int32_t     set_fields_by_fixed_index(rg_opaque_handle_t table, kt_uint32_t fixed_index,
                                         std::initializer_list<named_value> values);
kt_int32_t     set_fields_by_key(rg_opaque_handle_t table, kt_value_t key, std::initializer_list<named_value> values);
kt_int32_t     commit(rg_opaque_handle_t table); // apply and commit
rg_row_state_t state_of(rg_opaque_handle_t table, kt_uint32_t fixed_index);
// Fixed index of the key, or -code.
std::int64_t find_key(rg_opaque_handle_t table, kt_value_t key);

// ---- A table of each kind ----

struct table_kind {
    bool hashed;
    bool persistent;
};

// A tree with "/kept" mounted on a directory of its own.
class registry_of_tables
{
  public:
    registry_of_tables() { tree.mount("/kept", directory.path()); }

    rg_opaque_handle_t make(table_kind kind, std::vector<rg_column_t> columns, kt_int32_t mode = explicit_writing,
                            const std::string & name = "table")
    {
        const std::string path = (kind.persistent ? "/kept/" : "/scratch/") + name;
        return kind.hashed ? create_hashed_table(tree, path, std::move(columns), mode)
                           : create_table(tree, path, std::move(columns), mode);
    }

    static constexpr kt_int32_t explicit_writing = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
    static constexpr kt_int32_t implicit_writing = RG_MODE_READ | RG_MODE_WRITE;

    temp_dir  directory;
    open_tree tree;
};

class on_each_kind_of_table : public ::testing::TestWithParam<table_kind>, public registry_of_tables
{
  public:
    rg_opaque_handle_t make(std::vector<rg_column_t> columns, kt_int32_t mode = explicit_writing)
    {
        return registry_of_tables::make(GetParam(), std::move(columns), mode);
    }
};

inline std::string name_of_kind(const ::testing::TestParamInfo<table_kind> & info)
{
    return std::string(info.param.hashed ? "hashed" : "unhashed") + (info.param.persistent ? "_kept" : "_transient");
}

#define ON_EACH_KIND_OF_TABLE(suite)                                                                                   \
    INSTANTIATE_TEST_SUITE_P(tables, suite,                                                                            \
                             ::testing::Values(kt_test::table_kind{false, false}, kt_test::table_kind{true, false},    \
                                               kt_test::table_kind{false, true}, kt_test::table_kind{true, true}),     \
                             kt_test::name_of_kind)

} // namespace kt_test
