// SPDX-License-Identifier: MIT
// columns_kit: what the tests of column changes stand on: descriptions of tables, short forms of the calls, and a table
// of each kind with three rows.
#pragma once

#include <sys/stat.h>

#include <functional>
#include <map>

#include "support/rows.h"

namespace kt_test
{

// A table's description, released with the object.
class description
{
  public:
    description(rg_opaque_handle_t table, kt_int32_t all_metadata)
    {
        EXPECT_EQ(rg_get_table_metadata_1(table, all_metadata, &p_), 0) << error_text();
    }
    ~description() { EXPECT_EQ(rg_free_table_metadata_1(p_), 0); }
    description(const description &)                           = delete;
    description &               operator=(const description &) = delete;
    const rg_table_metadata_t * operator->() const { return p_; }

  private:
    rg_table_metadata_t * p_ = nullptr;
};

// A definition of structured data with two fields.
struct two_fields {
    kt_uint32_t    number_of_fields = 2;
    rg_field_def_t fields[2]        = {{KT_INT32, text("first")}, {KT_CHAR_PTR, text("second")}};
};

// ---- The calls, short ----

inline kt_int32_t add_columns(rg_opaque_handle_t table, std::vector<rg_column_t> columns)
{
    return rg_add_columns_1(table, columns.data(), static_cast<kt_uint32_t>(columns.size()));
}

inline kt_int32_t delete_columns(rg_opaque_handle_t table, const std::vector<std::string> & names)
{
    std::vector<kt_char_ptr_t> pointers;
    for (const std::string & name : names)
        pointers.push_back(text(name));
    return rg_delete_columns_1(table, pointers.data(), static_cast<kt_uint32_t>(pointers.size()));
}

inline kt_int32_t rename_column(rg_opaque_handle_t table, const std::string & name, const std::string & new_name)
{
    return rg_change_column_name_1(table, text(name), text(new_name));
}

inline kt_int32_t change_default(rg_opaque_handle_t table, const std::string & name, kt_value_t value)
{
    return rg_change_default_value_1(table, text(name), value);
}

inline kt_int32_t overlay_default(rg_opaque_handle_t table, const std::string & name, kt_value_t value)
{
    return rg_overlay_memory_default_value_1(table, text(name), value);
}

inline kt_int32_t overlay_qualifier(rg_opaque_handle_t table, const std::string & name, rg_qualifier_t qualifier)
{
    return rg_overlay_memory_column_qualifier_1(table, text(name), qualifier);
}

// Each change, as one that goes through on the table of three rows.
struct column_change {
    const char *                                  name;
    std::function<kt_int32_t(rg_opaque_handle_t)> make;
};

inline const std::vector<column_change> & all_changes()
{
    static const std::vector<column_change> changes = {
        {"add", [](rg_opaque_handle_t t) { return add_columns(t, {column("extra", KT_INT32)}); }},
        {"delete", [](rg_opaque_handle_t t) { return delete_columns(t, {"val"}); }},
        {"rename", [](rg_opaque_handle_t t) { return rename_column(t, "val", "value"); }},
        {"default", [](rg_opaque_handle_t t) { return change_default(t, "val", int64(7)); }},
    };
    return changes;
}

inline bool is_deletion(const column_change & change)
{
    return change.name == std::string("delete");
}

// A failure of the building, which clears the error record on its way.
inline void expect_failure_without_record(kt_int32_t expected, kt_int32_t rc)
{
    EXPECT_EQ(rc, expected);
    EXPECT_EQ(error_code(), 0);
}

inline void expect_failure(kt_int32_t expected, kt_int32_t rc)
{
    EXPECT_EQ(rc, expected);
    EXPECT_EQ(error_code(), expected);
}

// ---- What a table shows ----

inline std::vector<std::string> column_names_of(rg_opaque_handle_t table)
{
    const description        d(table, -1);
    std::vector<std::string> names;
    for (kt_uint32_t column = 0; column < d->number_of_columns; ++column)
        names.emplace_back(d->column_definitions[column].name);
    return names;
}

inline std::string default_string_of(rg_opaque_handle_t table, const std::string & name)
{
    const description d(table, -1);
    for (kt_uint32_t column = 0; column < d->number_of_columns; ++column)
        if (name == d->column_definitions[column].name)
            return d->column_definitions[column].default_value.ptr_char;
    return "<no such column>";
}

// The table's own record of a column.
inline rg_column_t & column_of(rg_opaque_handle_t table, const std::string & name)
{
    rg_i_table_t &    object = object_of(table);
    const kt_uint32_t column = rg_i_find_column(&object, name.c_str());
    EXPECT_NE(column, object.total_columns) << name;
    return object.p_columns[column];
}

inline ino_t file_identity(const std::string & path)
{
    struct stat status {
    };
    EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
    return status.st_ino;
}

// ---- A table of each kind with the columns id, name, val and three rows ----

inline std::vector<rg_column_t> three_columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR, RG_STANDARD, string("none")),
            column("val", KT_INT64, RG_STANDARD, int64(-1))};
}

using named_rows = std::map<std::uint32_t, std::pair<std::string, std::int64_t>>;

inline named_rows three_rows()
{
    return {{1, {"alpha", 10}}, {2, {"a name that is somewhat longer", 20}}, {3, {"", 30}}};
}

inline void add_rows(rg_opaque_handle_t table, const named_rows & rows)
{
    for (const auto & [id, values] : rows)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}, {"name", string(values.first)}, {"val", int64(values.second)}}),
                  0);
}

// All rows, by slot. Rows that no commit has show with `visible` only.
inline named_rows rows_in(rg_opaque_handle_t table, kt_uint32_t visible = 0, const std::string & name_column = "name")
{
    named_rows rows;
    for (kt_uint32_t slot = 0; slot < object_of(table).maximum_rows; ++slot) {
        const reading id = read_fixed(table, slot, "id", visible);
        if (id.rc == RG_E_ROW_DELETED)
            continue;
        EXPECT_EQ(id.rc, 0);
        rows[id.value.val_uint32] = {taken_string(read_fixed(table, slot, name_column, visible)),
                                     read_fixed(table, slot, "val", visible).value.val_int64};
    }
    return rows;
}

struct on_each_table_of_three_rows : on_each_kind_of_table {
    rg_opaque_handle_t filled(kt_int32_t mode = explicit_writing, const std::string & name = "table")
    {
        const rg_opaque_handle_t table = registry_of_tables::make(GetParam(), three_columns(), mode, name);
        add_rows(table, three_rows());
        if ((mode & RG_MODE_EXPLICIT_CONTROL) != 0) {
            EXPECT_EQ(commit(table), 0);
        }
        return table;
    }
    bool persistent() const { return GetParam().persistent; }
    // What a read asks for to see rows after a rebuild: in memory they aren't committed.
    kt_uint32_t visible() const { return persistent() ? 0 : 1; }
    std::string file(const std::string & name = "table") const { return directory.file(name); }

    // After a rebuild in memory: an update of each row and a commit bring the rows back.
    static void make_committed(rg_opaque_handle_t table)
    {
        for (kt_uint32_t slot = 0; slot < object_of(table).total_applied_rows; ++slot)
            ASSERT_EQ(set_fields_by_fixed_index(table, slot, {{"id", read_fixed(table, slot, "id", 1).value}}), 0);
        ASSERT_EQ(commit(table), 0);
    }

    // Closes the table and opens it again. A transient one has stayed where it is.
    rg_opaque_handle_t reopened(rg_opaque_handle_t table, kt_int32_t mode = RG_MODE_READ)
    {
        EXPECT_EQ(rg_close_table_1(table), 0);
        return open_table(tree, persistent() ? "/kept/table" : "/scratch/table", mode);
    }
};

} // namespace kt_test
