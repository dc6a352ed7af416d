// SPDX-License-Identifier: MIT
// packed_kit: tables as the tests of packed buffers write them down, and the buffers that they should become.
//
// The encoder here is written from the description of the format, on top of value_kit, and writes either byte order. So
// it stands for the foreign machine, and for what packing should give.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>

#include "protocol/table_model.h"
#include "rg_i_table.h"
#include "support/registry.h"
#include "support/rows.h"

namespace kt_test
{

// ---- The table in a tree -------------------------------------------------------------------------------------------

class table_maker
{
  public:
    rg_opaque_handle_t create(rg_opaque_handle_t tree, const table_model & table,
                              kt_int32_t mode = RG_MODE_READ | RG_MODE_WRITE)
    {
        std::vector<rg_column_t> columns;
        for (const column_model & c : table.columns)
            columns.push_back(rg_column_t{text(c.name), c.type, c.qualifier, c.properties, definition(c), value(c)});
        const rg_opaque_handle_t handle = create_table(tree, table.path, columns, mode);
        for (const std::vector<model> & row : table.rows)
            EXPECT_EQ(add(handle, table, row), 0) << error_text();
        return handle;
    }

    kt_int32_t add(rg_opaque_handle_t handle, const table_model & table, const std::vector<model> & row)
    {
        std::vector<kt_char_ptr_t> names;
        std::vector<kt_value_t>    values;
        std::vector<kt_value_t *>  pointers;
        for (size_t c = 0; c < row.size(); ++c) {
            names.push_back(text(table.columns[c].name));
            values.push_back(values_.make(row[c]));
        }
        for (kt_value_t & v : values)
            pointers.push_back(&v);
        return rg_add_row_1(handle, names.data(), pointers.data(), static_cast<kt_uint32_t>(names.size()));
    }

  private:
    kt_value_t value(const column_model & c)
    {
        return c.default_value.type == KT_UNKNOWN ? uint64(0) : values_.make(c.default_value);
    }

    rg_sd_def_t * definition(const column_model & c)
    {
        if (!is_structured(c.type))
            return nullptr;
        definitions_.push_back(
            std::make_unique<std::uint64_t[]>((sizeof(rg_sd_def_t) + c.fields.size() * sizeof(rg_field_def_t)) / 8));
        auto * p_definition            = reinterpret_cast<rg_sd_def_t *>(definitions_.back().get());
        p_definition->number_of_fields = static_cast<kt_uint32_t>(c.fields.size());
        rg_field_def_t * p_fields      = p_definition->fields;
        for (size_t f = 0; f < c.fields.size(); ++f)
            p_fields[f] = {c.fields[f].first, text(c.fields[f].second)};
        return p_definition;
    }

    client_values                                values_;
    std::deque<std::unique_ptr<std::uint64_t[]>> definitions_;
};

// What a table holds at a packed index, read value by value.
inline model read_model(rg_opaque_handle_t table, kt_uint32_t row, const std::string & name, kt_data_type_t type)
{
    const reading r = read_packed(table, row, name, 0);
    EXPECT_EQ(r.rc, 0) << name << ": " << error_text();
    if (r.rc != 0)
        return {};
    model m = model_of(type, r.value);
    if (!is_number(type))
        std::free(r.value.ptr_char);
    return m;
}

inline void expect_same_value(const model & expected, const model & actual)
{
    ASSERT_EQ(actual.type, expected.type);
    if (is_32_bit(expected.type))
        EXPECT_EQ(static_cast<std::uint32_t>(actual.number), static_cast<std::uint32_t>(expected.number));
    else if (is_number(expected.type))
        EXPECT_EQ(actual.number, expected.number);
    else
        EXPECT_EQ(item_of(actual, machine::here), item_of(expected, machine::here));
}

inline void expect_rows(rg_opaque_handle_t handle, const table_model & table)
{
    ASSERT_EQ(object_of(handle).total_committed_rows, table.rows.size());
    for (kt_uint32_t row = 0; row < table.rows.size(); ++row)
        for (size_t c = 0; c < table.columns.size(); ++c) {
            SCOPED_TRACE(table.columns[c].name + " of row " + std::to_string(row));
            expect_same_value(table.rows[row][c],
                              read_model(handle, row, table.columns[c].name, table.columns[c].type));
        }
}

// ---- The buffer that tables should become --------------------------------------------------------------------------

// The words of a row that mean nothing on the wire.
struct row_words {
    std::uint64_t p_next            = 0;
    std::uint32_t type              = 2;
    std::uint32_t disk_table_offset = 0;
    std::uint32_t replaces_offset   = 0;
    std::uint32_t behind            = 0; // the four bytes behind the record
};

// A row as the binary that it is taken for: everything behind the length word, which is the record's length.
inline model row_binary(const std::vector<model> & values, machine order, const row_words & words = {},
                        size_t spare_bytes = 0)
{
    octets row;
    append(row, words.p_next, order);
    append(row, words.type, order);
    append(row, words.disk_table_offset, order);
    append(row, words.replaces_offset, order);
    const size_t slots = row.size();
    row.resize(slots + 8 * values.size());
    octets indirect;
    for (size_t c = 0; c < values.size(); ++c) {
        const stored s = stored_of(values[c], order);
        std::copy(s.slot.begin(), s.slot.end(), row.begin() + static_cast<std::ptrdiff_t>(slots + 8 * c));
        // A row stores all eight bytes of the client's value: value_kit leaves such bytes in the unused half.
        if (is_32_bit(values[c].type))
            std::fill_n(row.begin() + static_cast<std::ptrdiff_t>(slots + 8 * c + 4), 4, std::uint8_t{0xA5});
        if (is_number(values[c].type))
            continue;
        put(row, slots + 8 * c, static_cast<std::uint32_t>(indirect.size()), order);
        const octets item = item_of(values[c], order);
        indirect.insert(indirect.end(), item.begin(), item.end());
    }
    row.insert(row.end(), indirect.begin(), indirect.end());
    row.resize(row.size() + spare_bytes);
    append(row, words.behind, order);
    return a_binary(std::string(row.begin(), row.end()));
}

struct packed_model {
    std::string name; // of the directory
    model       fixed_metadata;
    model       column_metadata;
    model       rows;
};

inline model column_element(const column_model & c)
{
    model default_value = c.default_value.type == KT_UNKNOWN ? empty_value(c.type) : c.default_value;
    if (is_structured(c.type))
        default_value = a_number(KT_UINT32, 0);
    std::vector<model> elements = {a_string(c.name),
                                   a_number(KT_UINT32, c.type),
                                   a_number(KT_UINT32, c.qualifier),
                                   a_number(KT_INT32, static_cast<std::uint32_t>(c.properties)),
                                   default_value,
                                   a_number(KT_UINT32, c.fields.size())};
    if (is_structured(c.type)) {
        model types = numbers(KT_UINT32_ARRAY, {});
        model names = an_array(KT_CHAR_PTR_ARRAY, {});
        for (size_t f = 0; f < c.fields.size(); ++f) {
            std::uint32_t type = c.fields[f].first;
            std::string   name = c.fields[f].second;
            if (f == 0) { // goes out four bytes too late; only good for names of four bytes or more
                std::memcpy(&type, name.data(), 4);
                name.erase(0, 4);
            }
            types.elements.push_back(a_number(KT_UINT32, type));
            names.elements.push_back(a_string(name));
        }
        elements.push_back(types);
        elements.push_back(names);
    }
    return structured(elements);
}

// A whole table as it should be packed, its directory name being its path.
inline packed_model packed_form(const table_model & table, machine order, const row_words & words = {},
                                std::uint64_t change_counter = 1)
{
    packed_model packed{table.path, {}, an_array(KT_SD_PTR_ARRAY, {}), an_array(KT_BINARY_PTR_ARRAY, {})};
    packed.fixed_metadata = structured({a_string(table.path), a_number(KT_UINT32, table.rows.size()),
                                        a_number(KT_UINT32, table.columns.size()), a_number(KT_UINT64, change_counter),
                                        a_number(KT_INT32, 0)});
    for (const column_model & c : table.columns)
        packed.column_metadata.elements.push_back(column_element(c));
    for (const std::vector<model> & row : table.rows)
        packed.rows.elements.push_back(row_binary(row, order, words));
    return packed;
}

inline octets buffer_of(const std::vector<packed_model> & tables, machine order)
{
    const std::uint8_t local   = std::endian::native == std::endian::big ? 3 : 2;
    const std::uint8_t foreign = local ^ 1;

    octets buffer(40 + 32 * tables.size());
    octets indirect;
    buffer[5] = order == machine::here ? local : foreign;
    buffer[6] = 2;
    put(buffer, 16, std::uint32_t{1}, order);
    put(buffer, 32, static_cast<std::uint32_t>(tables.size()), order);
    size_t slot = 40;
    for (const packed_model & table : tables)
        for (const model & m : {a_string(table.name), table.fixed_metadata, table.column_metadata, table.rows}) {
            const octets item = item_of(m, order);
            put(buffer, slot, static_cast<std::uint32_t>(indirect.size()), order);
            put(buffer, slot + 4, static_cast<std::uint32_t>(item.size()), order);
            indirect.insert(indirect.end(), item.begin(), item.end());
            slot += 8;
        }
    buffer.insert(buffer.end(), indirect.begin(), indirect.end());
    put(buffer, 0, static_cast<std::uint32_t>(buffer.size()), order);
    put(buffer, 24, static_cast<std::uint32_t>(buffer.size()), order);
    return buffer;
}

// ---- Looking into a buffer in local order --------------------------------------------------------------------------

inline std::uint32_t word_at(const octets & buffer, size_t at)
{
    std::uint32_t word = 0;
    EXPECT_LE(at + 4, buffer.size());
    if (at + 4 <= buffer.size())
        std::memcpy(&word, &buffer[at], 4);
    return word;
}

inline size_t indirect_start(const octets & buffer)
{
    return 40 + 32 * size_t{word_at(buffer, 32)};
}

enum class item { name = 0, fixed_metadata = 1, column_metadata = 2, rows = 3 };

inline size_t slot_of_item(size_t table, item which)
{
    return 40 + 32 * table + 8 * static_cast<size_t>(which);
}

inline size_t item_start(const octets & buffer, size_t table, item which)
{
    return indirect_start(buffer) + word_at(buffer, slot_of_item(table, which));
}

inline kt_uint32_t row_count(const octets & buffer, size_t table = 0)
{
    return word_at(buffer, item_start(buffer, table, item::rows));
}

inline size_t row_start(const octets & buffer, size_t table, size_t row)
{
    const size_t array = item_start(buffer, table, item::rows);
    return array + word_at(buffer, array + 8 + 8 * row);
}

// The value of a table's item, through the value library.
inline model item_model(octets & buffer, size_t table, item which)
{
    constexpr kt_data_type_t types[] = {KT_CHAR_PTR, KT_SD_PTR, KT_SD_PTR_ARRAY, KT_BINARY_PTR_ARRAY};
    const kt_data_type_t     type    = types[static_cast<size_t>(which)];
    kt_value_t               value;
    const size_t             start = indirect_start(buffer);
    EXPECT_EQ(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, type, &value, &buffer[slot_of_item(table, which)],
                                                       buffer.data() + start,
                                                       static_cast<kt_uint32_t>(buffer.size() - start)),
              0);
    model m = model_of(type, value);
    std::free(value.ptr_char);
    return m;
}

// Clears the words that carry no meaning: links, file offsets, and what stands behind each row's record.
inline void clear_row_words(octets & buffer)
{
    for (size_t table = 0; table < word_at(buffer, 32); ++table)
        for (size_t row = 0; row < row_count(buffer, table); ++row) {
            const size_t at = row_start(buffer, table, row);
            std::fill_n(buffer.begin() + static_cast<std::ptrdiff_t>(at + 4), 8, std::uint8_t{0});
            put(buffer, at + 16, std::uint32_t{0}, machine::here);
            put(buffer, at + 20, std::uint32_t{0}, machine::here);
            put(buffer, at + word_at(buffer, at), std::uint32_t{0}, machine::here);
        }
}

// ---- Packing, short ------------------------------------------------------------------------------------------------

struct to_pack {
    rg_opaque_handle_t       table;
    kt_uint32_t              visible = 0;
    std::vector<kt_uint32_t> chosen  = {};
};

inline kt_int32_t pack(const std::vector<to_pack> & tables, octets * p_result)
{
    std::vector<rg_opaque_handle_t> handles;
    std::vector<kt_uint32_t>        visible, totals, chosen;
    for (const to_pack & t : tables) {
        handles.push_back(t.table);
        visible.push_back(t.visible);
        totals.push_back(static_cast<kt_uint32_t>(t.chosen.size()));
        chosen.insert(chosen.end(), t.chosen.begin(), t.chosen.end());
    }
    void *           p_buffer = nullptr;
    const kt_int32_t rc = rg_pack_tables_1(static_cast<kt_uint32_t>(tables.size()), handles.data(), visible.data(),
                                           totals.data(), chosen.empty() ? nullptr : chosen.data(), &p_buffer);
    if (rc != 0) {
        EXPECT_EQ(p_buffer, nullptr) << "a failure delivers nothing";
        return rc;
    }
    kt_uint32_t length = 0;
    std::memcpy(&length, p_buffer, sizeof length);
    p_result->assign(static_cast<std::uint8_t *>(p_buffer), static_cast<std::uint8_t *>(p_buffer) + length);
    std::free(p_buffer);
    return 0;
}

inline octets packed(const std::vector<to_pack> & tables)
{
    octets result;
    EXPECT_EQ(pack(tables, &result), 0) << error_text();
    return result;
}

} // namespace kt_test
