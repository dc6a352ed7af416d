// SPDX-License-Identifier: MIT
// verbs: what ktrg does, one function a verb. The command line (command_line.cpp) fills the options in; the verbs know
// nothing of how they were written.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "failure.h"
#include "output.h"
#include "talk.h"

namespace ktrg
{

// What every verb has.
struct common_options {
    std::optional<output_form> form; // none: the verb's own
    output_style               style;
    error_style                errors       = error_style::text;
    bool                       quiet        = false;
    bool                       verbose      = false;
    bool                       dry_run      = false;
    bool                       force        = false;
    double                     wait_seconds = 0;

    // The style with the form that the user asked for, or else the verb's own.
    [[nodiscard]] output_style style_or(output_form own) const
    {
        output_style result = style;
        result.form         = form.value_or(own);
        return result;
    }
};

struct ls_options {
    std::string directory; // empty: where names without "/" are looked for
};

struct table_options {
    std::string table;
};

struct get_options {
    std::string              table;
    std::vector<std::string> keys;
    std::vector<std::string> columns;
};

struct select_options {
    std::string                table;
    std::optional<std::string> expression; // none: all rows
    std::vector<std::string>   columns;
    std::vector<std::string>   sort; // column names, with "-" in front for descending order
    std::optional<std::size_t> limit;
    bool                       count = false;
};

struct copy_options {
    std::string source;
    std::string target; // a table, or a directory for one of the same name
};

struct tables_options {
    std::vector<std::string> tables;
};

struct alter_options {
    std::string              table;
    std::vector<std::string> add;      // name:type[:flags][=default],...
    std::vector<std::string> drop;     // names
    std::vector<std::string> rename;   // a=b
    std::vector<std::string> defaults; // a=v
};

struct pack_options {
    std::string              file; // "-": standard output
    std::vector<std::string> tables;
    std::string              prefix; // registry path of the tables' directories
};

struct unpack_options {
    std::string file; // "-": standard input
    std::string directory;
    bool        info = false;
};

struct import_options {
    std::string              table;
    std::string              file;
    std::string              format; // empty: by the file's name, csv if that says nothing
    std::string              on_conflict = "error";
    std::string              rejects;    // empty: a row that can't be had ends the import
    std::size_t              batch  = 0; // 0: all rows are one transaction
    bool                     create = false;
    std::string              key;
    std::vector<std::string> types;   // name:type[:flags][=default],...
    std::vector<std::string> renamed; // a=b: the file's column a is the table's b; a=: it is left out
};

struct export_options {
    std::string              table;
    std::vector<std::string> columns;
};

struct create_options {
    std::string              table;
    std::vector<std::string> columns; // name:type[:flags][=default]
};

struct put_options {
    std::string              table;
    std::vector<std::string> values; // COL=VAL
    bool                     insert = false;
    bool                     update = false;
};

struct rm_options {
    std::string                table;
    std::vector<std::string>   keys;
    std::optional<std::string> where; // an expression
    bool                       all = false;
};

[[nodiscard]] exit_code run_ls(const common_options & common, const ls_options & options);
[[nodiscard]] exit_code run_schema(const common_options & common, const table_options & options);
[[nodiscard]] exit_code run_stat(const common_options & common, const table_options & options);
[[nodiscard]] exit_code run_get(const common_options & common, const get_options & options);
[[nodiscard]] exit_code run_select(const common_options & common, const select_options & options);
[[nodiscard]] exit_code run_import(const common_options & common, const import_options & options);
[[nodiscard]] exit_code run_export(const common_options & common, const export_options & options);
[[nodiscard]] exit_code run_create(const common_options & common, const create_options & options);
[[nodiscard]] exit_code run_put(const common_options & common, const put_options & options);
[[nodiscard]] exit_code run_rm(const common_options & common, const rm_options & options);
[[nodiscard]] exit_code run_alter(const common_options & common, const alter_options & options);
[[nodiscard]] exit_code run_cp(const common_options & common, const copy_options & options);
[[nodiscard]] exit_code run_mv(const common_options & common, const copy_options & options);
[[nodiscard]] exit_code run_drop(const common_options & common, const tables_options & options);
[[nodiscard]] exit_code run_repair(const common_options & common, const tables_options & options);
[[nodiscard]] exit_code run_pack(const common_options & common, const pack_options & options);
[[nodiscard]] exit_code run_unpack(const common_options & common, const unpack_options & options);

} // namespace ktrg
