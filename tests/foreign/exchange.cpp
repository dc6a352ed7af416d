// SPDX-License-Identifier: MIT
// exchange: packs a table with a value of every type, or takes such a buffer from whatever machine, converts it,
// unpacks it and compares it value by value. run.sh runs it on machines of both byte orders.
//
//   exchange pack FILE     exchange check FILE
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>

#include "protocol/table_model.h"
#include "rg_i_table.h"

using namespace kt_test;

namespace
{

unsigned failures = 0;

void expect(bool condition, const std::string & what)
{
    if (condition)
        return;
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    std::fprintf(stderr, "exchange: %s (%s)\n", what.c_str(), record.p_text);
    ++failures;
}

void require(bool condition, const std::string & what)
{
    expect(condition, what);
    if (!condition)
        std::exit(1);
}

struct definition {
    explicit definition(const column_model & c)
    {
        words.resize((sizeof(rg_sd_def_t) + c.fields.size() * sizeof(rg_field_def_t)) / 8);
        get()->number_of_fields  = static_cast<kt_uint32_t>(c.fields.size());
        rg_field_def_t * p_field = get()->fields;
        for (const auto & [type, name] : c.fields)
            *p_field++ = {type, const_cast<char *>(name.c_str())};
    }
    rg_sd_def_t * get() { return reinterpret_cast<rg_sd_def_t *>(words.data()); }

    std::vector<std::uint64_t> words;
};

rg_opaque_handle_t make_table(rg_opaque_handle_t tree, const table_model & table, client_values & values)
{
    std::deque<definition>     definitions;
    std::vector<rg_column_t>   columns;
    std::vector<kt_char_ptr_t> names;
    for (const column_model & c : table.columns) {
        definitions.emplace_back(c);
        names.push_back(const_cast<char *>(c.name.c_str()));
        columns.push_back({names.back(), c.type, c.qualifier, c.properties,
                           is_structured(c.type) ? definitions.back().get() : nullptr, values.make(c.default_value)});
    }
    rg_opaque_handle_t handle = nullptr;
    std::string        path   = table.path;
    require(rg_create_table_1(tree, path.data(), columns.data(), static_cast<kt_uint32_t>(columns.size()),
                              RG_MODE_WRITE, &handle) == 0,
            "the table can't be created");
    for (const std::vector<model> & row : table.rows) {
        std::vector<kt_value_t>   fields;
        std::vector<kt_value_t *> pointers;
        for (const model & m : row)
            fields.push_back(values.make(m));
        for (kt_value_t & field : fields)
            pointers.push_back(&field);
        require(rg_add_row_1(handle, names.data(), pointers.data(), static_cast<kt_uint32_t>(names.size())) == 0,
                "a row can't be added");
    }
    return handle;
}

void pack(rg_opaque_handle_t tree, const table_model & table, const char * p_file)
{
    client_values      values;
    rg_opaque_handle_t handle   = make_table(tree, table, values);
    kt_uint32_t        zero     = 0;
    void *             p_buffer = nullptr;
    require(rg_pack_tables_1(1, &handle, &zero, &zero, nullptr, &p_buffer) == 0, "the table can't be packed");
    std::ofstream(p_file, std::ios::binary).write(static_cast<char *>(p_buffer), rg_i_load_u32(p_buffer));
    std::free(p_buffer);
}

bool same(const model & expected, kt_data_type_t type, const kt_value_t & value)
{
    const model actual = model_of(type, value);
    if (!is_number(type))
        return item_of(actual, machine::here) == item_of(expected, machine::here);
    return is_32_bit(type) ? static_cast<std::uint32_t>(actual.number) == static_cast<std::uint32_t>(expected.number)
                           : actual.number == expected.number;
}

void compare(rg_opaque_handle_t handle, const table_model & expected)
{
    const rg_i_table_t & table = *static_cast<rg_i_table_t *>(handle);
    require(table.total_columns == expected.columns.size(), "another number of columns");
    require(table.total_committed_rows == expected.rows.size(), "another number of rows");
    for (kt_uint32_t c = 0; c < table.total_columns; ++c) {
        const column_model & told   = expected.columns[c];
        const rg_column_t &  column = table.p_columns[c];
        expect(column.name == told.name && column.type == told.type && column.qualifier == told.qualifier &&
                   column.properties == told.properties,
               told.name + ": another column");
        kt_value_t value;
        require(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, column.type, &value, &column.default_value,
                                                         rg_i_default_data(&table),
                                                         rg_i_default_data_length(&table)) == 0,
                told.name + ": its default can't be read");
        expect(same(is_structured(told.type) ? model{.type = told.type} : told.default_value, told.type, value),
               told.name + ": another default");
        if (!is_number(told.type))
            std::free(value.ptr_char);
        for (kt_uint32_t row = 0; row < expected.rows.size(); ++row) {
            require(rg_get_field_by_index_1(handle, static_cast<kt_int32_t>(row), column.name, &value) == 0,
                    told.name + ": a value can't be read");
            expect(same(expected.rows[row][c], told.type, value), told.name + ": another value");
            if (!is_number(told.type))
                std::free(value.ptr_char);
        }
    }
}

void check(rg_opaque_handle_t tree, const table_model & table, const char * p_file)
{
    std::ifstream     file(p_file, std::ios::binary);
    std::vector<char> buffer{std::istreambuf_iterator<char>(file), {}};
    require(buffer.size() > 40, "no buffer");
    require(rg_convert_packed_table_buffer_1(buffer.data(), 0, 0) == 0, "the buffer can't be converted");
    require(rg_i_load_u32(buffer.data()) == buffer.size(), "another length");
    kt_uint32_t        total  = 0;
    kt_char_ptr_t      p_name = nullptr;
    rg_opaque_handle_t handle = nullptr;
    require(rg_get_total_packed_tables_1(buffer.data(), &total) == 0 && total == 1, "another number of tables");
    require(rg_get_packed_table_name_1(buffer.data(), 0, &p_name) == 0 && p_name == table.path, "another name");
    require(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, tree, 0, &handle) == 0,
            "the table can't be unpacked");
    compare(handle, table);
}

} // namespace

int main(int argc, char ** argv)
{
    if (argc != 3 || (std::strcmp(argv[1], "pack") != 0 && std::strcmp(argv[1], "check") != 0)) {
        std::fprintf(stderr, "exchange pack|check FILE\n");
        return 2;
    }
    rg_opaque_handle_t tree = nullptr;
    require(rg_open_tree_1(&tree, 0, 0) == 0, "no tree");
    const table_model table = table_of_everything();
    if (argv[1][0] == 'p')
        pack(tree, table, argv[2]);
    else
        check(tree, table, argv[2]);
    rg_close_tree_1(tree);
    return failures == 0 ? 0 : 1;
}
