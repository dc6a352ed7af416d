// SPDX-License-Identifier: MIT
// verb_options: the verbs as the command line knows them: their arguments, options, and examples for their help. A
// function each; to add a verb, add one here and its run_... in a file of its own.
#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "choices.h"
#include "settings.h"

namespace ktrg
{

namespace
{

using lines = std::vector<const char *>;

// A verb whose callback notes that it is the one to run. Its help ends with examples, and details ahead of them.
template <class Options>
CLI::App * add_verb(CLI::App & app, settings & set, const char * p_name, const char * p_group, const char * p_about,
                    exit_code (*run)(const common_options &, const Options &), const Options & options,
                    const lines & examples, const lines & details = {})
{
    CLI::App *  p_verb = app.add_subcommand(p_name, p_about)->group(p_group);
    std::string footer;
    for (const char * p_detail : details)
        footer += fmt::format("{}\n", p_detail);
    footer += fmt::format("{}{}:\n", details.empty() ? "" : "\n", examples.size() == 1 ? "Example" : "Examples");
    for (const char * p_example : examples)
        footer += fmt::format("  ktrg {}\n", p_example);
    p_verb->footer(footer + "\nThe options that all verbs have: `ktrg --help`.");
    p_verb->callback([&set, run, &options] { set.verb = [&set, run, &options] { return run(set.common, options); }; });
    return p_verb;
}

void add_table(CLI::App & verb, std::string & table)
{
    verb.add_option("TABLE", table, "Path of the table")->required();
}

// A list such as `a,b`, which may be given several times.
CLI::Option * add_list(CLI::App & verb, const char * p_flags, std::vector<std::string> & list, const char * p_about,
                       const char * p_what)
{
    return verb.add_option(p_flags, list, p_about)->delimiter(',')->type_name(p_what)->allow_extra_args(false);
}

// ---- Look ----

void add_ls(CLI::App & app, settings & set)
{
    CLI::App * p_verb =
        add_verb(app, set, "ls", "Look", "List the tables of a directory", run_ls, set.ls, {"ls state", "ls -o json"});
    p_verb->add_option("DIR", set.ls.directory, "Directory; $KTRG_ROOT or the current one without it");
}

void add_schema(CLI::App & app, settings & set)
{
    add_table(*add_verb(app, set, "schema", "Look", "Show the columns of a table", run_schema, set.schema,
                        {"schema state/hosts", "create copy $(ktrg schema state/hosts)"}),
              set.schema.table);
}

void add_stat(CLI::App & app, settings & set)
{
    add_table(*add_verb(app, set, "stat", "Look", "Show what a table's file is made of", run_stat, set.stat,
                        {"stat state/hosts"}),
              set.stat.table);
}

// ---- Read ----

void add_get(CLI::App & app, settings & set)
{
    CLI::App * p_verb = add_verb(app, set, "get", "Read", "Show rows by their keys", run_get, set.get,
                                 {"get state/hosts alpha beta --columns name,load"});
    add_table(*p_verb, set.get.table);
    p_verb->add_option("KEY", set.get.keys, "Keys")->required();
    add_list(*p_verb, "-c,--columns", set.get.columns, "Columns to show, separated by commas", "COL,...");
}

void add_select(CLI::App & app, settings & set)
{
    CLI::App * p_verb =
        add_verb(app, set, "select", "Read", "Show the rows that match an expression, or all", run_select, set.select,
                 {"select state/hosts 'load > 2' --sort -load --limit 10", "select state/hosts --count"});
    add_table(*p_verb, set.select.table);
    p_verb->add_option("EXPR", set.select.expression,
                       "Which rows, as in 'load > 2 && name like \"a%\"'; all without it");
    add_list(*p_verb, "-c,--columns", set.select.columns, "Columns to show, separated by commas", "COL,...");
    add_list(*p_verb, "-s,--sort", set.select.sort, "Columns to sort by; -COL sorts downwards", "COL,...");
    p_verb->add_option("-l,--limit", set.select.limit, "Show so many rows at most")->type_name("N");
    p_verb->add_flag("--count", set.select.count, "Show the number of rows only");
}

// ---- Write ----

void add_import(CLI::App & app, settings & set)
{
    import_options & options = set.import;
    CLI::App *       p_verb  = add_verb(
               app, set, "import", "Write", "Add the rows of a file, in one transaction", run_import, options,
               {"import state/hosts hosts.csv --create --key name --types load:float32",
                "import state/hosts new.jsonl --on-conflict update --rejects bad.jsonl",
                "export state/hosts -o jsonl | ktrg import copy - --format jsonl --create"},
               {"A cell that is missing takes the column's default, or keeps the row's value in an update. JSON is an",
                "array of objects or one object, and JSONL an object a line; objects within need --types. TSV has no",
                "quotes: \\t, \\n, \\r and \\\\ stand for a tab, line ends and a backslash.", "",
                "Without --rejects a row that can't be had ends the import, and nothing is changed. With it the others",
                "go in, and the exit code is 10. The file of rejected rows has the input's form, and the reason in a",
                "column reject_reason; leave that out with --map reject_reason= when they come again."});
    add_table(*p_verb, options.table);
    p_verb->add_option("FILE", options.file, "The file; - is standard input")->required();
    p_verb->add_option("--format", options.format, "csv, tsv, json or jsonl; without it the file's name decides")
        ->check(one_of({"csv", "tsv", "json", "jsonl"}))
        ->type_name("FORM");
    p_verb->add_flag("--create", options.create, "Make the table, with types that fit the file");
    p_verb->add_option("-k,--key", options.key, "The new table's key; the first column without it")->type_name("COL");
    p_verb->add_option("-t,--types", options.types, "Types that are not to be detected, as name:type[:flags][=default]")
        ->type_name("COL:TYPE,...")
        ->allow_extra_args(false);
    add_list(*p_verb, "--map", options.renamed, "The file's column FROM is the table's TO; FROM= leaves it out",
             "FROM=TO,...");
    p_verb
        ->add_option("--on-conflict", options.on_conflict,
                     "A row whose key exists: error, update (set its columns) or skip")
        ->check(one_of({"error", "update", "skip"}))
        ->type_name("HOW");
    p_verb->add_option("--batch", options.batch, "Make each N rows a transaction of their own")
        ->check(CLI::PositiveNumber.description(""))
        ->type_name("N");
    p_verb->add_option("--rejects", options.rejects, "Put rows that can't be had into this file, and go on")
        ->type_name("FILE");
}

void add_put(CLI::App & app, settings & set)
{
    CLI::App * p_verb = add_verb(app, set, "put", "Write", "Add a row, or update the one with the key", run_put,
                                 set.put, {"put state/hosts name=alpha load=0.5"});
    add_table(*p_verb, set.put.table);
    p_verb->add_option("COL=VAL", set.put.values, "Values; the key's is among them")->required();
    CLI::Option * p_insert = p_verb->add_flag("--insert", set.put.insert, "The row must be new");
    p_verb->add_flag("--update", set.put.update, "The row must exist")->excludes(p_insert);
}

void add_rm(CLI::App & app, settings & set)
{
    CLI::App * p_verb = add_verb(app, set, "rm", "Write", "Delete rows, in one transaction", run_rm, set.rm,
                                 {"rm state/hosts alpha beta", "rm state/hosts --where 'load > 100' --dry-run"});
    add_table(*p_verb, set.rm.table);
    p_verb->add_option("KEY", set.rm.keys, "Keys of the rows");
    p_verb->add_option("-w,--where", set.rm.where, "The rows that match an expression")->type_name("EXPR");
    p_verb->add_flag("--all", set.rm.all, "Every row; needs --force");
}

// ---- Shape: whole tables ----

void add_create(CLI::App & app, settings & set)
{
    CLI::App * p_verb = add_verb(app, set, "create", "Shape", "Make an empty table", run_create, set.create,
                                 {"create state/disks id:uint32:key name:string= size:uint64"});
    add_table(*p_verb, set.create.table);
    p_verb
        ->add_option("COLUMN", set.create.columns,
                     "Columns as name:type[:flags][=default], as in id:uint32:key name:string= load:float64")
        ->required();
}

void add_alter(CLI::App & app, settings & set)
{
    alter_options & options = set.alter;
    CLI::App *      p_verb  = add_verb(
              app, set, "alter", "Shape", "Change the columns of a table, in one transaction", run_alter, options,
              {"alter state/hosts --add 'site:string=home' --drop cpus --rename load=load1",
               "alter state/hosts --default load=0.5 --dry-run"},
              {"All options name the columns as they are now, so that names may be exchanged. Rows that exist take",
               "the defaults of added columns, and keep their values when a default changes. A dry run shows the new",
               "schema.", "",
               "The library changes columns one call at a time. So the changes are made to a copy of the table,",
               "which then takes its place in one step: readers see the old table or the new one, whatever happens.",
               "Rows, blob and key stay, and the change counter goes up by one."});
    add_table(*p_verb, options.table);
    p_verb->add_option("--add", options.add, "New columns, as name:type[:flags][=default]")
        ->type_name("COLUMN,...")
        ->allow_extra_args(false);
    add_list(*p_verb, "--drop", options.drop, "Columns that go, with their values", "COL,...");
    add_list(*p_verb, "--rename", options.rename, "Columns that get another name", "FROM=TO,...");
    p_verb->add_option("--default", options.defaults, "A column's default for rows to come; once for each column")
        ->type_name("COL=VAL")
        ->allow_extra_args(false);
}

void add_copy_arguments(CLI::App & verb, copy_options & options)
{
    verb.add_option("SOURCE", options.source, "Path of the table")->required();
    verb.add_option("TARGET", options.target, "Path of the other table, or a directory")->required();
}

void add_cp(CLI::App & app, settings & set)
{
    add_copy_arguments(
        *add_verb(app, set, "cp", "Shape", "Copy a table", run_cp, set.cp,
                  {"cp state/hosts state/hosts_before", "cp state/hosts backup/ --force"},
                  {"The copy has the table's rows, blob and change counter as of its last commit, and no dead bytes.",
                   "A target that exists needs --force, and is replaced in one step: a reader finds the old table",
                   "or the new one."}),
        set.cp);
}

void add_mv(CLI::App & app, settings & set)
{
    add_copy_arguments(
        *add_verb(app, set, "mv", "Shape", "Give a table another name or directory", run_mv, set.mv,
                  {"mv state/hosts state/machines", "mv state/hosts archive/"},
                  {"A target that exists needs --force, and is replaced in one step. In one file system the move as a",
                   "whole is one step. To another one the table is copied and then removed."}),
        set.mv);
}

void add_drop(CLI::App & app, settings & set)
{
    add_verb(app, set, "drop", "Shape", "Remove whole tables; needs --force", run_drop, set.drop,
             {"drop state/hosts --force", "drop state/hosts@1041 --force"},
             {"All tables are looked at before the first is removed. One that is damaged can be dropped too; what",
              "doesn't look like a table at all is left alone."})
        ->add_option("TABLE", set.drop.tables, "Paths of the tables")
        ->required();
}

// ---- Whole ----

void add_export(CLI::App & app, settings & set)
{
    CLI::App * p_verb =
        add_verb(app, set, "export", "Whole", "Write all rows for other programs", run_export, set.exports,
                 {"export state/hosts > hosts.csv", "export state/hosts -o jsonl --columns name,load"},
                 {"As csv, or as -o says: tsv, json, jsonl or markdown. All columns, invisible ones too; import takes",
                  "csv, tsv, json and jsonl back."});
    add_table(*p_verb, set.exports.table);
    add_list(*p_verb, "-c,--columns", set.exports.columns, "Columns to write, separated by commas", "COL,...");
}

void add_pack(CLI::App & app, settings & set)
{
    pack_options & options = set.pack;
    CLI::App *     p_verb =
        add_verb(app, set, "pack", "Whole", "Put tables into one file that travels between machines", run_pack, options,
                 {"pack state.packed state/hosts state/disks", "pack - state/hosts | ssh other ktrg unpack - state"},
                 {"Each table goes as of its last commit. Blobs and defaults of structures don't travel, and the first",
                  "field of a structure loses the first four letters of its name: ktrg says where that happens. A file",
                  "that exists needs --force."});
    p_verb->add_option("FILE", options.file, "The new file; - is standard output")->required();
    p_verb->add_option("TABLE", options.tables, "Paths of the tables")->required();
    p_verb
        ->add_option("--prefix", options.prefix,
                     "Registry path of the tables' directory for programs that unpack; /t without it")
        ->type_name("PATH");
}

void add_unpack(CLI::App & app, settings & set)
{
    unpack_options & options = set.unpack;
    CLI::App *       p_verb =
        add_verb(app, set, "unpack", "Whole", "Make tables of a packed file, or describe it", run_unpack, options,
                 {"unpack state.packed restored", "unpack state.packed --info", "unpack state.packed --info -o json"},
                 {"Files of both byte orders are understood. All tables appear, or none: they are made in a directory",
                  "of their own beside their places, each value is looked at, and then they are renamed. Tables that",
                  "exist need --force."});
    p_verb->add_option("FILE", options.file, "The packed file; - is standard input")->required();
    p_verb->add_option("DIR", options.directory, "Directory for the tables");
    p_verb->add_flag("--info", options.info, "Show byte order, tables, columns, rows and bytes instead");
}

// ---- Care ----

void add_repair(CLI::App & app, settings & set)
{
    add_verb(app, set, "repair", "Care", "Remove rewrite files that were left behind", run_repair, set.repair,
             {"repair state", "repair state/hosts --dry-run"},
             {"A process that is killed in the middle of a rewrite leaves a file beside the table, NAME.rewrite, which",
              "nobody reads; a killed alter or unpack leaves a directory .ktrg-XXXXXX. The tables themselves need no",
              "repair: each stands at its last commit. What another process holds is left alone."})
        ->add_option("PATH", set.repair.tables, "Tables, or directories for all that is in them")
        ->required();
}

} // namespace

void add_verbs(CLI::App & app, settings & set)
{
    add_ls(app, set);
    add_schema(app, set);
    add_stat(app, set);
    add_get(app, set);
    add_select(app, set);
    add_import(app, set);
    add_put(app, set);
    add_rm(app, set);
    add_create(app, set);
    add_alter(app, set);
    add_cp(app, set);
    add_mv(app, set);
    add_drop(app, set);
    add_export(app, set);
    add_pack(app, set);
    add_unpack(app, set);
    add_repair(app, set);
}

} // namespace ktrg
