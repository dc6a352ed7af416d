// SPDX-License-Identifier: MIT
// registry: what the tests stand on: a temporary directory, an open tree, columns and rows in one line, the error
// record, and files as bytes.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

#include "kt_ku.h"
#include "kt_rg.h"

namespace kt_test
{

// A directory of the test's own, removed with all that is in it.
class temp_dir
{
  public:
    temp_dir();
    ~temp_dir();
    temp_dir(const temp_dir &)                      = delete;
    temp_dir &          operator=(const temp_dir &) = delete;
    const std::string & path() const { return path_; }
    std::string         file(const std::string & name) const { return path_ + "/" + name; }

  private:
    std::string path_;
};

using bytes = std::vector<std::uint8_t>;

bytes read_file(const std::string & path);
void  write_file(const std::string & path, const bytes & content);
bool  file_exists(const std::string & path);
// "5b 00 00 ..." and anything else that isn't a hexadecimal digit is passed over.
bytes       from_hex(const std::string & text);
std::string to_hex(const bytes & content); // 16 bytes a line, for readable differences

// A writable C string for the interface's kt_char_ptr_t parameters; lives as long as the program.
kt_char_ptr_t text(const std::string & s);

// ---- Values ----
kt_value_t int32(std::int32_t v);
kt_value_t uint32(std::uint32_t v);
kt_value_t int64(std::int64_t v);
kt_value_t uint64(std::uint64_t v);
kt_value_t float32(float v);
kt_value_t float64(double v);
kt_value_t string(const std::string & v);
kt_value_t null_value();

// ---- Columns ----
rg_column_t column(const std::string & name, kt_data_type_t type, rg_qualifier_t qualifier = RG_STANDARD,
                   kt_value_t default_value = uint64(0));

// ---- The error record of this thread ----
kt_int32_t  error_code();
kt_int32_t  error_message_index();
std::string error_text();

// ---- A tree, closed at the end ----
class open_tree
{
  public:
    open_tree() { EXPECT_EQ(rg_open_tree_1(&handle_, 0, 0), 0); }
    ~open_tree() { close(); }
    open_tree(const open_tree &)             = delete;
    open_tree & operator=(const open_tree &) = delete;
                operator rg_opaque_handle_t() const { return handle_; }
    void        close()
    {
        if (handle_ != nullptr) {
            EXPECT_EQ(rg_close_tree_1(std::exchange(handle_, nullptr)), 0);
        }
    }
    void mount(const std::string & registry_path, const std::string & directory)
    {
        ASSERT_EQ(rg_mount_local_tree_1(handle_, text(registry_path), text(directory), 1), 0);
    }

  private:
    rg_opaque_handle_t handle_ = nullptr;
};

// ---- Tables and rows ----
using named_value = std::pair<std::string, kt_value_t>;

// The handle, or NULL with *p_rc set.
rg_opaque_handle_t create_table(rg_opaque_handle_t tree, const std::string & path, std::vector<rg_column_t> columns,
                                kt_int32_t mode, kt_int32_t * p_rc = nullptr);
// Hashed by string_hash/uint32_hash... according to the key column's type, with the given number of buckets.
rg_opaque_handle_t create_hashed_table(rg_opaque_handle_t tree, const std::string & path,
                                       std::vector<rg_column_t> columns, kt_int32_t mode, kt_uint32_t buckets = 1024,
                                       kt_int32_t * p_rc = nullptr);
rg_opaque_handle_t open_table(rg_opaque_handle_t tree, const std::string & path, kt_int32_t mode,
                              kt_int32_t * p_rc = nullptr);
kt_int32_t         add_row(rg_opaque_handle_t table, std::initializer_list<named_value> values);

// Hash and compare functions for the two common key types; the buckets are 1024.
kt_uint32_t hash_uint32(void * p_key);
kt_int32_t  compare_uint32(void * p_key1, void * p_key2);
kt_uint32_t hash_string(void * p_key);
kt_int32_t  compare_string(void * p_key1, void * p_key2);

} // namespace kt_test
