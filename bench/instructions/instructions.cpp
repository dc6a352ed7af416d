// SPDX-License-Identifier: MIT
// instructions: makes one kind of call many times inside measured_calls, where an instruction counter looks.
//
// Run by ./measure under a simulator that counts the instructions of that function and of all it calls. Counts don't
// depend on how busy or how fast a machine is, so a call that has become slower is seen anywhere.
//
//     instructions            the names of the calls, one a line
//     instructions NAME       makes the calls; prints how many, or how many rows they looked at
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <utility>

#include "kt_ku.h"
#include "kt_rg.h"

namespace
{

constexpr kt_uint32_t table_rows    = 10'000;
constexpr kt_uint32_t calls         = 2'000;
constexpr kt_uint32_t durable_calls = 50;
constexpr kt_uint32_t buckets       = 16'384;

void require(bool condition, const char * p_what)
{
    if (condition)
        return;
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    std::fprintf(stderr, "instructions: %s: %s\n", p_what, record.p_text);
    std::exit(1);
}

// ---- A table of five columns ----

kt_uint32_t hash_id(void * p_key)
{
    kt_uint32_t key;
    std::memcpy(&key, p_key, sizeof key);
    return (key * 2654435761u) >> 18;
}
static_assert(buckets == 1u << (32 - 18));

kt_int32_t compare_ids(void * p_key1, void * p_key2)
{
    return std::memcmp(p_key1, p_key2, sizeof(kt_uint32_t));
}

char Names[5][8]{"id", "count", "ratio", "kind", "name"};

kt_value_t id_value(kt_uint32_t id)
{
    kt_value_t value{};
    value.val_uint32 = id;
    return value;
}

struct fields_t {
    fields_t()
    {
        for (int i = 0; i < 5; ++i) {
            names[i]    = Names[i];
            pointers[i] = &values[i];
        }
    }
    void become(kt_uint32_t id)
    {
        values[0]             = id_value(id);
        values[1].val_int64   = std::int64_t{id} * 3;
        values[2].val_float64 = id * 0.5;
        values[3].val_int32   = static_cast<kt_int32_t>(id % 7);
        values[4].ptr_char    = text;
        std::snprintf(text, sizeof text, "name-%011u", id); // 16 characters
    }

    kt_char_ptr_t names[5]{};
    kt_value_t    values[5]{};
    kt_value_t *  pointers[5]{};
    char          text[32]{};
};

class registry
{
  public:
    registry()
    {
        std::string pattern = (std::filesystem::temp_directory_path() / "instructions.XXXXXX").string();
        require(mkdtemp(pattern.data()) != nullptr, "directory");
        directory_ = pattern;
        require(rg_open_tree_1(&tree_, 0, 0) == 0, "open tree");
        char path[]{"/m"};
        require(rg_mount_local_tree_1(tree_, path, directory_.data(), 1) == 0, "mount");
    }
    ~registry()
    {
        rg_close_tree_1(tree_);
        std::filesystem::remove_all(directory_);
    }
    registry(const registry &)             = delete;
    registry & operator=(const registry &) = delete;

    rg_opaque_handle_t create(const char * p_path)
    {
        rg_column_t          columns[5]{};
        const kt_data_type_t types[5]{KT_UINT32, KT_INT64, KT_FLOAT64, KT_INT32, KT_CHAR_PTR};
        for (int i = 0; i < 5; ++i)
            columns[i] = {Names[i], types[i], i == 0 ? kt_uint32_t{RG_PRIMARY_KEY} : kt_uint32_t{RG_STANDARD},
                          0,        nullptr,  {}};
        std::string        path  = p_path;
        rg_opaque_handle_t table = nullptr;
        require(rg_create_hashed_key_table_1(tree_, path.data(), columns, 5,
                                             RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL, buckets, hash_id,
                                             compare_ids, &table) == 0,
                "create");
        fields_t fields;
        for (kt_uint32_t id = 0; id < table_rows; ++id) {
            fields.become(id);
            require(rg_add_row_1(table, fields.names, fields.pointers, 5) == 0, "add");
        }
        commit(table);
        return table;
    }
    rg_opaque_handle_t open(const char * p_path)
    {
        std::string        path  = p_path;
        rg_opaque_handle_t table = nullptr;
        require(rg_open_table_1(tree_, path.data(), RG_MODE_READ, &table) == 0, "open");
        return table;
    }
    static void commit(rg_opaque_handle_t table)
    {
        require(rg_apply_1(table, 0) == 0, "apply");
        require(rg_commit_1(table) == 0, "commit");
    }

  private:
    rg_opaque_handle_t tree_ = nullptr;
    std::string        directory_;
};

// ---- What is measured ----

struct subject_t {
    registry           home;
    rg_opaque_handle_t table = nullptr;
    fields_t           fields;
    kt_uint32_t        n = 0; // of this call
    kt_uint32_t        id() const { return n * 7919 % table_rows; }
};

void read_integer(subject_t & s)
{
    kt_value_t value;
    require(rg_get_field_by_key_1(s.table, id_value(s.id()), Names[1], &value) == 0, "read");
}

void read_string(subject_t & s)
{
    kt_value_t value;
    require(rg_get_field_by_key_1(s.table, id_value(s.id()), Names[4], &value) == 0, "read");
    std::free(value.ptr_char);
}

void read_row(subject_t & s)
{
    require(rg_get_fields_by_key_1(s.table, id_value(s.id()), s.fields.names, s.fields.pointers, 5) == 0, "read");
    std::free(s.fields.values[4].ptr_char);
}

void read_by_index(subject_t & s)
{
    kt_value_t value;
    require(rg_get_field_by_index_1(s.table, static_cast<kt_int32_t>(s.id()), Names[1], &value) == 0, "read");
}

void find_row(subject_t & s)
{
    kt_uint32_t fixed_index = 0;
    require(rg_get_fixed_row_index_for_key_1(s.table, id_value(s.id()), &fixed_index) == 0, "find");
}

void add_row(subject_t & s)
{
    s.fields.values[0] = id_value(table_rows + s.n);
    require(rg_add_row_1(s.table, s.fields.names, s.fields.pointers, 5) == 0, "add");
}

void set_field(subject_t & s)
{
    kt_value_t value{};
    value.val_int64 = s.n;
    require(rg_set_field_by_key_1(s.table, id_value(s.id()), Names[1], &value) == 0, "set");
}

void delete_row(subject_t & s)
{
    require(rg_delete_row_by_index_1(s.table, static_cast<kt_int32_t>(s.n)) == 0, "delete");
}

void set_and_commit(subject_t & s)
{
    set_field(s);
    registry::commit(s.table);
}

void list_selected(rg_opaque_handle_t table, kt_char_ptr_t p_criteria, ...)
{
    kt_uint32_t   total  = 0;
    kt_uint32_t * p_rows = nullptr;
    va_list       variables;
    va_start(variables, p_criteria);
    const kt_int32_t rc = rg_get_selected_rows_v_1(table, p_criteria, variables, 0, &total, &p_rows);
    va_end(variables);
    require(rc == 0 && total > 0, "list");
    std::free(p_rows);
}

void list_rows(subject_t & s)
{
    char criteria[]{"count > 1000 && name like \"name-%\" && ratio < 4000"};
    list_selected(s.table, criteria);
}

void copy_rows(subject_t & s)
{
    char               criteria[]{"kind == 3"};
    rg_opaque_handle_t result = nullptr;
    require(rg_select_1(s.table, s.fields.names, 5, &result, criteria) == 0, "select");
    require(rg_close_table_1(result) == 0, "close");
}

void open_and_close(subject_t & s)
{
    if (s.table != nullptr) // while it is open, opening it again does next to nothing
        require(rg_close_table_1(std::exchange(s.table, nullptr)) == 0, "close");
    require(rg_close_table_1(s.home.open("/m/t")) == 0, "close");
}

struct measured_t {
    const char * p_name;
    void (*call)(subject_t &);
    kt_uint32_t  calls;
    kt_uint32_t  rows_a_call; // what a figure counts: rows where a call looks at all of them, else calls
    const char * p_path;
};

constexpr measured_t all_measured[]{
    {"rg_get_field_by_key_1, integer", read_integer, calls, 1, "/t"},
    {"rg_get_field_by_key_1, 16 characters", read_string, calls, 1, "/t"},
    {"rg_get_fields_by_key_1, 5 columns", read_row, calls, 1, "/t"},
    {"rg_get_field_by_index_1, integer", read_by_index, calls, 1, "/t"},
    {"rg_get_fixed_row_index_for_key_1", find_row, calls, 1, "/t"},
    {"rg_add_row_1, 5 columns", add_row, calls, 1, "/t"},
    {"rg_set_field_by_key_1, integer", set_field, calls, 1, "/t"},
    {"rg_delete_row_by_index_1", delete_row, calls, 1, "/t"},
    {"rg_set_field_by_key_1, rg_apply_1, rg_commit_1", set_and_commit, durable_calls, 1, "/m/t"},
    {"rg_get_selected_rows_v_1, 3 conditions, a row", list_rows, 1, table_rows, "/t"},
    {"rg_select_1, a seventh, a row", copy_rows, 1, table_rows, "/t"},
    {"rg_open_table_1, rg_close_table_1, a row", open_and_close, 1, table_rows, "/m/t"},
};

} // namespace

// The counter is switched on here; the name is what it goes by.
extern "C" __attribute__((noinline)) void measured_calls(void (*call)(void *), void * p_subject, kt_uint32_t count)
{
    for (kt_uint32_t n = 0; n < count; ++n)
        call(p_subject);
}

int main(int argc, char ** argv)
{
    if (argc < 2) {
        for (const measured_t & measured : all_measured)
            std::printf("%s\n", measured.p_name);
        return 0;
    }
    for (const measured_t & measured : all_measured) {
        if (std::strcmp(measured.p_name, argv[1]) != 0)
            continue;
        struct context_t {
            subject_t          subject;
            const measured_t * p_measured;
        } context;
        context.p_measured    = &measured;
        context.subject.table = context.subject.home.create(measured.p_path);
        context.subject.fields.become(1);
        const auto make_call = [](void * p) {
            auto & c = *static_cast<context_t *>(p);
            c.p_measured->call(c.subject);
            ++c.subject.n;
        };
        make_call(&context); // what only the first call costs, such as the binding of symbols
        measured_calls(make_call, &context, measured.calls);
        std::printf("%u\n", measured.calls * measured.rows_a_call);
        return 0;
    }
    std::fprintf(stderr, "instructions: no call named \"%s\"\n", argv[1]);
    return 2;
}
