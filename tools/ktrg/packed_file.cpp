// SPDX-License-Identifier: MIT
// packed_file: see its header.
//
// The items that describe a table are read by the value library, which checks them; their lengths are taken from the
// directory, which the library has checked to lie in the buffer by then.
#include "packed_file.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <memory>

#include <fmt/format.h>

#include "failure.h"
#include "key_hash.h"
#include "kt_pmsg.h"
#include "text_rows.h"

namespace ktrg
{

namespace
{

constexpr std::uint8_t  protocol_of_tables = 2;
constexpr std::uint64_t directory_start    = 40;
constexpr std::uint64_t directory_entry    = 32;

struct free_block {
    void operator()(void * p) const { std::free(p); }
};

// A client value of one block.
using sd_block    = std::unique_ptr<kt_structured_data_t, free_block>;
using array_block = std::unique_ptr<kt_array_t, free_block>;

bool has(const kt_structured_data_t & data, std::uint32_t element, kt_data_type_t type)
{
    return element < data.element_count && data.elements[element].data_type == type;
}

// The sender's file name where there was a file; else the path, with "," for each "/" within it.
std::string file_name_for(const std::string & path, const std::string & sender_name)
{
    std::string name = sender_name.substr(sender_name.rfind('/') + 1);
    if (sender_name == path || !path.ends_with(registry_path_at("", name))) {
        name = path.substr(path.starts_with('/') ? 1 : 0);
        std::replace(name.begin(), name.end(), '/', ',');
    }
    return is_table_file_name(name) ? name : std::string();
}

} // namespace

failure packed_file::damaged(std::string_view what) const
{
    return failure(exit_code::damaged, name_, fmt::format("the packed file is damaged: {}", what), RG_E_LIBRARY_CALL);
}

kt_uint32_t packed_file::word(std::uint64_t offset) const
{
    kt_uint32_t value = 0;
    std::memcpy(&value, content_.data() + offset, sizeof value);
    return value;
}

// The length is compared before anything believes it.
void packed_file::check_header()
{
    kt_pmsg_header_t header{};
    if (content_.size() >= sizeof header)
        std::memcpy(&header, content_.data(), sizeof header);
    if (content_.size() < directory_start || header.kt_pmsg_proto_type != protocol_of_tables ||
        header.kt_pmsg_version != 0 || (header.kt_pmsg_arch_props & ~KT_PMSG_ARCH_BIG_ENDIAN) != KT_PMSG_ARCH_64_BIT)
        throw failure(exit_code::damaged, name_, "not a file of packed tables", RG_E_LIBRARY_CALL);
    big_endian_           = (header.kt_pmsg_arch_props & KT_PMSG_ARCH_BIG_ENDIAN) != 0;
    kt_int32_t is_foreign = 0;
    if (kt_pmsg_cnv_required_1(&header, &is_foreign) != 0 || header.kt_pmsg_length != content_.size())
        throw damaged(fmt::format("it has {} bytes, and its header says {}", content_.size(), header.kt_pmsg_length));
}

packed_file packed_file::read(const std::string & file)
{
    packed_file result;
    result.name_    = file == "-" ? "standard input" : file;
    result.content_ = read_whole(file, "");
    result.check_header();
    void *      p_buffer = result.content_.data();
    kt_uint32_t count    = 0;
    if (rg_convert_packed_table_buffer_1(p_buffer, 0, 0) != 0)
        throw result.damaged("its values can't be brought into this machine's byte order");
    if (rg_get_total_packed_tables_1(p_buffer, &count) != 0)
        throw result.damaged("it is too short for its tables");
    for (kt_uint32_t i = 0; i < count; i++)
        result.tables_.push_back(result.describe(i));
    return result;
}

packed_table packed_file::describe(std::size_t index)
{
    packed_table        result;
    kt_char_ptr_t       p_name = nullptr;
    const std::uint64_t area   = directory_start + directory_entry * word(32);
    const std::uint64_t entry  = directory_start + directory_entry * index;
    const auto          bound  = static_cast<kt_pmsg_len_t>(content_.size() - area);
    if (rg_get_packed_table_name_1(content_.data(), static_cast<kt_uint32_t>(index), &p_name) != 0)
        throw damaged(fmt::format("table {} has no name", index + 1));
    result.sender_name = p_name;

    kt_value_t fixed{};
    kt_value_t columns{};
    if (kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, KT_SD_PTR, &fixed, content_.data() + entry + 8,
                                                 content_.data() + area, bound) != 0)
        throw damaged(fmt::format("table {} isn't described", index + 1));
    const sd_block fixed_block(fixed.ptr_sd);
    if (kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, KT_SD_PTR_ARRAY, &columns, content_.data() + entry + 16,
                                                 content_.data() + area, bound) != 0)
        throw damaged(fmt::format("the columns of table {} aren't described", index + 1));
    const array_block columns_block(columns.ptr_array);
    const bool        complete = has(*fixed_block, 0, KT_CHAR_PTR) && has(*fixed_block, 1, KT_UINT32) &&
                          has(*fixed_block, 3, KT_UINT64) && columns_block->element_count != 0 &&
                          has(*columns_block->elements[0].ptr_sd, 1, KT_UINT32);
    if (!complete)
        throw damaged(fmt::format("the description of table {} lacks something", index + 1));
    result.path      = fixed_block->elements[0].value.ptr_char;
    result.rows      = fixed_block->elements[1].value.val_uint32;
    result.counter   = fixed_block->elements[3].value.val_uint64;
    result.key_type  = columns_block->elements[0].ptr_sd->elements[1].value.val_uint32;
    result.file_name = file_name_for(result.path, result.sender_name);
    for (std::uint64_t slot = 0; slot < 4; slot++)
        result.bytes += word(entry + 8 * slot + 4);
    return result;
}

table packed_file::unpack(std::size_t index, const place & target)
{
    const packed_table & packed = tables_[index];
    // Rows may have been chosen more than once. A bucket count that is somewhat low costs time and nothing else.
    const key_hash hash = key_hash_for(packed.key_type, packed.rows);
    place          at   = target;
    at.registry_path    = packed.path;
    const stopwatch time;
    table           result = table::from_packed(at, content_.data(), static_cast<kt_uint32_t>(index), hash);
    row_values      values(result.columns());
    for (std::uint64_t position = 0; result.read(position, values); position++) {
    }
    tell(fmt::format("{}: unpacked: {}, {}, {} bytes, counter {} on the sender, {}", target.name,
                     counted(result.count(), "row"), counted(result.columns().size(), "column"), packed.bytes,
                     packed.counter, time.text()));
    return result;
}

} // namespace ktrg
