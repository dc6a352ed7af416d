// SPDX-License-Identifier: MIT
// registry: see registry.h.
#include "support/registry.h"

#include <cstdio>
#include <cstdlib>
#include <deque>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <mutex>

namespace kt_test
{

temp_dir::temp_dir()
{
    std::string pattern = (std::filesystem::temp_directory_path() / "kt_rg_test.XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr)
        std::abort();
    path_ = pattern;
}

temp_dir::~temp_dir()
{
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

bytes read_file(const std::string & path)
{
    std::ifstream in(path, std::ios::binary);
    EXPECT_TRUE(in) << path;
    return bytes(std::istreambuf_iterator<char>(in), {});
}

void write_file(const std::string & path, const bytes & content)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char *>(content.data()), static_cast<std::streamsize>(content.size()));
    ASSERT_TRUE(out) << path;
}

bool file_exists(const std::string & path)
{
    return std::filesystem::exists(path);
}

bytes from_hex(const std::string & text)
{
    bytes       result;
    std::string digits;
    for (const char c : text)
        if (std::isxdigit(static_cast<unsigned char>(c)) != 0) {
            digits += c;
            if (digits.size() == 2) {
                result.push_back(static_cast<std::uint8_t>(std::stoul(digits, nullptr, 16)));
                digits.clear();
            }
        }
    return result;
}

std::string to_hex(const bytes & content)
{
    std::string result;
    char        digits[8];
    for (size_t i = 0; i < content.size(); ++i) {
        std::snprintf(digits, sizeof digits, "%02x", content[i]);
        result += digits;
        result += i % 16 == 15 ? '\n' : ' ';
    }
    return result;
}

kt_char_ptr_t text(const std::string & s)
{
    static std::mutex              mutex;
    static std::deque<std::string> kept;
    const std::lock_guard          lock(mutex);
    return kept.emplace_back(s).data();
}

namespace
{

template <class Set> kt_value_t value_with(Set set)
{
    kt_value_t value;
    std::memset(&value, 0, sizeof value);
    set(value);
    return value;
}

} // namespace

kt_value_t int32(std::int32_t v)
{
    return value_with([&](kt_value_t & value) { value.val_int32 = v; });
}

kt_value_t uint32(std::uint32_t v)
{
    return value_with([&](kt_value_t & value) { value.val_uint32 = v; });
}

kt_value_t int64(std::int64_t v)
{
    return value_with([&](kt_value_t & value) { value.val_int64 = v; });
}

kt_value_t uint64(std::uint64_t v)
{
    return value_with([&](kt_value_t & value) { value.val_uint64 = v; });
}

kt_value_t float32(float v)
{
    return value_with([&](kt_value_t & value) { value.val_float32 = v; });
}

kt_value_t float64(double v)
{
    return value_with([&](kt_value_t & value) { value.val_float64 = v; });
}

kt_value_t string(const std::string & v)
{
    return value_with([&](kt_value_t & value) { value.ptr_char = text(v); });
}

kt_value_t null_value()
{
    return value_with([](kt_value_t & value) { value.ptr_char = nullptr; });
}

rg_column_t column(const std::string & name, kt_data_type_t type, rg_qualifier_t qualifier, kt_value_t default_value)
{
    return rg_column_t{text(name), type, qualifier, 0, nullptr, default_value};
}

kt_int32_t error_code()
{
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    return record.code;
}

kt_int32_t error_message_index()
{
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    return record.message;
}

std::string error_text()
{
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    return record.p_text;
}

namespace
{

rg_opaque_handle_t delivered(kt_int32_t rc, rg_opaque_handle_t handle, kt_int32_t * p_rc)
{
    if (p_rc != nullptr)
        *p_rc = rc;
    else
        EXPECT_EQ(rc, 0) << error_text();
    return rc == 0 ? handle : nullptr;
}

} // namespace

rg_opaque_handle_t create_table(rg_opaque_handle_t tree, const std::string & path, std::vector<rg_column_t> columns,
                                kt_int32_t mode, kt_int32_t * p_rc)
{
    rg_opaque_handle_t handle = nullptr;
    const kt_int32_t   rc =
        rg_create_table_1(tree, text(path), columns.data(), static_cast<kt_uint32_t>(columns.size()), mode, &handle);
    return delivered(rc, handle, p_rc);
}

rg_opaque_handle_t create_hashed_table(rg_opaque_handle_t tree, const std::string & path,
                                       std::vector<rg_column_t> columns, kt_int32_t mode, kt_uint32_t buckets,
                                       kt_int32_t * p_rc)
{
    bool string_key = false;
    for (const rg_column_t & c : columns)
        if ((c.qualifier & 15) >= RG_PRIMARY_KEY)
            string_key = c.type == KT_CHAR_PTR;
    rg_opaque_handle_t handle = nullptr;
    const kt_int32_t   rc     = rg_create_hashed_key_table_1(
              tree, text(path), columns.data(), static_cast<kt_uint32_t>(columns.size()), mode, buckets,
        string_key ? hash_string : hash_uint32, string_key ? compare_string : compare_uint32, &handle);
    return delivered(rc, handle, p_rc);
}

rg_opaque_handle_t open_table(rg_opaque_handle_t tree, const std::string & path, kt_int32_t mode, kt_int32_t * p_rc)
{
    rg_opaque_handle_t handle = nullptr;
    const kt_int32_t   rc     = rg_open_table_1(tree, text(path), mode, &handle);
    return delivered(rc, handle, p_rc);
}

kt_int32_t add_row(rg_opaque_handle_t table, std::initializer_list<named_value> values)
{
    std::vector<kt_char_ptr_t> names;
    std::vector<kt_value_t>    copies;
    std::vector<kt_value_t *>  pointers;
    for (const named_value & v : values) {
        names.push_back(text(v.first));
        copies.push_back(v.second);
    }
    for (kt_value_t & copy : copies)
        pointers.push_back(&copy);
    return rg_add_row_1(table, names.data(), pointers.data(), static_cast<kt_uint32_t>(names.size()));
}

kt_uint32_t hash_uint32(void * p_key)
{
    kt_uint32_t key;
    std::memcpy(&key, p_key, sizeof key);
    return (key * 2654435761u) >> 22;
}

kt_int32_t compare_uint32(void * p_key1, void * p_key2)
{
    return std::memcmp(p_key1, p_key2, sizeof(kt_uint32_t));
}

kt_uint32_t hash_string(void * p_key)
{
    kt_uint32_t hash = 2166136261u;
    for (const char * p = static_cast<const char *>(p_key); *p != '\0'; ++p)
        hash = (hash ^ static_cast<unsigned char>(*p)) * 16777619u;
    return hash >> 22;
}

kt_int32_t compare_string(void * p_key1, void * p_key2)
{
    return std::strcmp(static_cast<const char *>(p_key1), static_cast<const char *>(p_key2));
}

} // namespace kt_test
