// SPDX-License-Identifier: MIT
// settings: what a command line says, before a verb runs.
#pragma once

#include <functional>
#include <string>

#include "verbs.h"

namespace CLI
{
class App;
}

namespace ktrg
{

// A key such as -5 looks like an option. A mark that no option begins with goes in front of it, and off again before
// the verb sees it.
inline constexpr char number_mark = '\x01';

struct settings {
    common_options common;
    std::string    form;
    std::string    colour    = "auto";
    std::string    bytes     = "hex";
    std::string    int64     = "number";
    std::string    errors    = "text";
    bool           no_header = false;

    ls_options     ls;
    table_options  schema;
    table_options  stat;
    get_options    get;
    select_options select;
    import_options import;
    export_options exports;
    create_options create;
    put_options    put;
    rm_options     rm;
    alter_options  alter;
    copy_options   cp;
    copy_options   mv;
    tables_options drop;
    tables_options repair;
    pack_options   pack;
    unpack_options unpack;

    std::function<exit_code()> verb; // what was asked for
};

// Declares the verbs, with their options and examples.
void add_verbs(CLI::App & app, settings & set);

} // namespace ktrg
