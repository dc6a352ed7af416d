// SPDX-License-Identifier: MIT
// command_line: parses with CLI11 and runs the verb. The verbs' own options are declared in verb_options.cpp.
//
// The common options stand anywhere, ahead of the verb or behind it. All of CLI11's own exit codes become 2.
#include "command_line.h"

#include <cstdlib>
#include <map>
#include <new>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "choices.h"
#include "settings.h"

namespace ktrg
{

namespace
{

bool is_negative_number(std::string_view argument)
{
    return argument.size() > 1 && argument[0] == '-' &&
           ((argument[1] >= '0' && argument[1] <= '9') || argument[1] == '.');
}

void unmark(std::string & text)
{
    if (!text.empty() && text[0] == number_mark)
        text.erase(0, 1);
}

void add_common_options(CLI::App & app, settings & set)
{
    app.add_option("-o,--output", set.form, "Form of the output: table, line, csv, tsv, json, jsonl or markdown")
        ->check(one_of({"table", "line", "csv", "tsv", "json", "jsonl", "markdown"}))
        ->type_name("FORM");
    app.add_flag("-H,--no-header", set.no_header, "No header in the output, or none in the file that is imported");
    app.add_option("--null", set.common.style.null_text, "Text for what is missing")->type_name("CELL");
    app.add_option("--bytes", set.bytes, "How binaries are shown: hex, base64 or text")
        ->check(one_of({"hex", "base64", "text"}))
        ->type_name("HOW");
    app.add_option("--json-int64", set.int64, "64-bit integers in JSON: number or string")
        ->check(one_of({"number", "string"}))
        ->type_name("HOW");
    app.add_option("--color", set.colour, "auto, always or never (NO_COLOR is honoured)")
        ->check(one_of({"auto", "always", "never"}))
        ->type_name("WHEN");
    app.add_option("--errors", set.errors, "Errors as text or json")
        ->check(one_of({"text", "json"}))
        ->type_name("FORM");
    app.add_option("--wait", set.common.wait_seconds, "Wait so long for a table that another process holds")
        ->check(CLI::NonNegativeNumber.description(""))
        ->type_name("SECONDS");
    app.add_flag("-n,--dry-run", set.common.dry_run, "Do all but the change itself");
    app.add_flag("-f,--force", set.common.force, "Do what destroys");
    app.add_flag("-q,--quiet", set.common.quiet, "No counts and hints on standard error");
    app.add_flag("-v,--verbose", set.common.verbose,
                 "More of them: what is opened and committed, how large it is, how long it took");
}

bool wants_colour(const std::string & when, bool terminal)
{
    const char * p_no_colour = std::getenv("NO_COLOR");
    const char * p_terminal  = std::getenv("TERM");
    if (when != "auto")
        return when == "always";
    return terminal && (p_no_colour == nullptr || *p_no_colour == '\0') &&
           (p_terminal == nullptr || std::string_view(p_terminal) != "dumb");
}

void finish_settings(settings & set)
{
    const std::map<std::string, output_form> forms = {
        {"table", output_form::table},       {"line", output_form::line}, {"csv", output_form::csv},
        {"tsv", output_form::tsv},           {"json", output_form::json}, {"jsonl", output_form::jsonl},
        {"markdown", output_form::markdown},
    };
    if (!set.form.empty())
        set.common.form = forms.at(set.form);
    output_style & style         = set.common.style;
    style.header                 = !set.no_header;
    style.terminal_width         = width_of_terminal();
    style.colour                 = wants_colour(set.colour, style.terminal_width != 0);
    style.values.bytes           = set.bytes == "base64" ? bytes_form::base64
                                   : set.bytes == "text" ? bytes_form::text
                                                         : bytes_form::hex;
    style.values.int64_as_string = set.int64 == "string";
    for (std::string & key : set.get.keys)
        unmark(key);
    if (set.select.expression.has_value())
        unmark(*set.select.expression);
    if (set.rm.where.has_value())
        unmark(*set.rm.where);
    for (std::string & key : set.rm.keys)
        unmark(key);
}

std::vector<std::string> verb_names(const CLI::App & app)
{
    std::vector<std::string> names;
    for (const CLI::App * p_verb : app.get_subcommands([](const CLI::App *) { return true; }))
        names.push_back(p_verb->get_name());
    return names;
}

// CLI11's complaint in one line, and a near verb if there is none of that name.
failure usage_failure(const CLI::App & app, const std::vector<std::string> & arguments, const CLI::ParseError & error)
{
    const std::vector<std::string> verbs = verb_names(app);
    for (const std::string & argument : arguments) {
        if (argument.starts_with('-'))
            continue;
        if (std::find(verbs.begin(), verbs.end(), argument) != verbs.end())
            break;
        if (app.get_subcommands().empty())
            return failure(exit_code::usage, "",
                           fmt::format("no verb {}{}; `ktrg --help` lists them", in_quotes(argument),
                                       did_you_mean(argument, verbs)));
        break;
    }
    if (app.get_subcommands().empty() && error.get_name() == "RequiredError")
        return failure(exit_code::usage, "", "what shall be done? `ktrg --help` lists the verbs");
    std::string text = error.what();
    for (char & c : text)
        if (c == '\n' || c == number_mark)
            c = ' ';
    const auto        parsed = app.get_subcommands();
    const std::string verb   = parsed.empty() ? "" : parsed.front()->get_name() + " ";
    return failure(exit_code::usage, "", fmt::format("{}; `ktrg {}--help` tells more", text, verb));
}

} // namespace

int run_command_line(int argc, const char * const * argv)
{
    settings set;
    CLI::App app{"ktrg: look into the tables of a registry, and change them.\n"
                 "A table is a file, named by its path. A name without \"/\" is looked for in $KTRG_ROOT, else in the "
                 "current directory."};
    app.name("ktrg");
    app.set_version_flag("--version", "ktrg " KTRG_VERSION);
    app.get_formatter()->label("SUBCOMMAND", "VERB");
    app.get_formatter()->label("REQUIRED", "");
    app.get_formatter()->label("TEXT", "");
    app.get_formatter()->column_width(28);
    app.fallthrough();
    app.require_subcommand(1);
    app.footer(
        "Exit codes: 0 done, 1 a plain no, 2 usage, 3 not found, 4 damaged, 5 busy, 6 conflict, 7 input/output,\n"
        "8 not permitted, 10 done in part, 70 internal error, 130 interrupted.");
    add_common_options(app, set);
    add_verbs(app, set);

    std::vector<std::string> arguments;
    for (int i = argc - 1; i > 0; i--) // in reverse, as CLI11 takes a vector
        arguments.push_back((is_negative_number(argv[i]) ? std::string(1, number_mark) : std::string()) + argv[i]);
    try {
        std::vector<std::string> to_parse = arguments;
        app.parse(to_parse);
    } catch (const CLI::Success & help) {
        return app.exit(help);
    } catch (const CLI::ParseError & error) {
        const std::vector<std::string> in_order(arguments.rbegin(), arguments.rend());
        print_failure(usage_failure(app, in_order, error), error_style::text);
        return static_cast<int>(exit_code::usage);
    }
    finish_settings(set);
    if (set.common.verbose)
        be_verbose();
    const stopwatch time;
    set.common.errors = set.errors == "json" ? error_style::json : error_style::text;
    try {
        const exit_code result = set.verb();
        tell(fmt::format("{} in all", time.text()));
        return static_cast<int>(result);
    } catch (const failure & what) {
        print_failure(what, set.common.errors);
        return static_cast<int>(what.exit());
    } catch (const std::bad_alloc &) {
        print_failure(failure(exit_code::input_output, "", "out of memory", 12), set.common.errors);
        return static_cast<int>(exit_code::input_output);
    } catch (const std::exception & what) {
        print_failure(failure(exit_code::internal, "", what.what()), set.common.errors);
        return static_cast<int>(exit_code::internal);
    }
}

} // namespace ktrg
