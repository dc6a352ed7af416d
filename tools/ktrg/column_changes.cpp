// SPDX-License-Identifier: MIT
// column_changes: see its header.
//
// The options name columns as they are before any change. The order of the work is: drop, defaults, renames, additions.
#include "column_changes.h"

#include <algorithm>

#include <fmt/format.h>

#include "column_definitions.h"
#include "failure.h"

namespace ktrg
{

namespace
{

[[noreturn]] void refuse(const std::string & subject, std::string text, kt_int32_t code = RG_E_INVALID_COLUMN)
{
    throw failure(exit_code::usage, subject, std::move(text), code);
}

bool is_among(const std::vector<std::string> & names, const std::string & name)
{
    return std::find(names.begin(), names.end(), name) != names.end();
}

// What stands in front of the "=" of an option, and behind it.
std::pair<std::string, std::string> split_pair(const std::string & text, const char * p_option, const char * p_form,
                                               const std::string & subject)
{
    const std::size_t equals = text.find('=');
    if (equals == std::string::npos || equals == 0)
        refuse(subject, fmt::format("{} wants {}, not {}", p_option, p_form, in_quotes(text)), 0);
    return {text.substr(0, equals), text.substr(equals + 1)};
}

class planner
{
  public:
    planner(const std::vector<column> & columns, const std::string & subject) : columns_(columns), subject_(subject)
    {
        result_.result = columns;
    }

    void drop(const std::string & name)
    {
        const column & gone = columns_[find_column(columns_, name, subject_)];
        if (is_among(result_.drop, name))
            refuse(subject_, fmt::format("column \"{}\" is dropped twice", name));
        if (gone.is_key())
            refuse(subject_, fmt::format("column \"{}\" is the key: it can't be dropped", name));
        if ((gone.qualifier & RG_INVISIBLE) != 0)
            refuse(subject_, fmt::format("column \"{}\" is invisible: it can't be dropped", name));
        result_.drop.push_back(name);
        std::erase_if(result_.result, [&name](const column & each) { return each.name == name; });
    }

    void set_default(const std::string & text)
    {
        const auto [name, value] = split_pair(text, "--default", "COL=VAL", subject_);
        column & changed         = remaining(name, "--default");
        changed.default_text     = value;
        for (const column & other : result_.defaults)
            if (other.name == name)
                refuse(subject_, fmt::format("column \"{}\" has two defaults", name));
        result_.defaults.push_back(changed);
    }

    void rename(const std::string & text)
    {
        const auto [name, new_name] = split_pair(text, "--rename", "FROM=TO", subject_);
        remaining(name, "--rename");
        if (!is_column_name(new_name))
            refuse(subject_,
                   fmt::format("no column can have the name {}: a letter, then letters, digits and \"_\", 255 "
                               "at most",
                               in_quotes(new_name)));
        for (const auto & other : renames_)
            if (other.first == name)
                refuse(subject_, fmt::format("column \"{}\" is renamed twice", name));
        renames_.emplace_back(name, new_name);
    }

    void add(const column & added)
    {
        if (added.is_key())
            refuse(subject_,
                   fmt::format("column \"{}\" can't be added as a key: the key is \"{}\"", added.name,
                               columns_.front().name),
                   RG_E_DUPLICATE_KEY);
        result_.add.push_back(added);
    }

    column_changes finish()
    {
        order_renames();
        for (column & each : result_.result)
            for (const auto & [name, new_name] : renames_)
                if (each.name == name) {
                    each.name = new_name;
                    break;
                }
        result_.result.insert(result_.result.end(), result_.add.begin(), result_.add.end());
        for (const column & each : result_.result)
            for (const column & other : result_.result)
                if (&other > &each && other.name == each.name)
                    refuse(subject_, fmt::format("two columns would have the name \"{}\"", each.name),
                           RG_E_DUPLICATE_COLUMN);
        column_definitions checked(result_.result, subject_); // the defaults fit
        return std::move(result_);
    }

  private:
    // A column that is there and isn't dropped. The library changes names and defaults only where nothing is invisible.
    column & remaining(const std::string & name, const char * p_option)
    {
        (void)find_column(columns_, name, subject_);
        for (const column & each : columns_)
            if ((each.qualifier & RG_INVISIBLE) != 0)
                refuse(subject_, fmt::format("{} can't be done while the table has the invisible column \"{}\"",
                                             p_option, each.name));
        for (column & each : result_.result)
            if (each.name == name)
                return each;
        refuse(subject_, fmt::format("column \"{}\" is dropped: {} has nothing to change", name, p_option));
    }

    // A rename whose new name is free comes first. Where all of them wait for each other, one steps aside.
    void order_renames()
    {
        std::vector<std::string>                         names = column_names(result_.result);
        std::vector<std::pair<std::string, std::string>> open  = renames_;
        const auto do_one = [&](const std::string & name, const std::string & new_name) {
            *std::find(names.begin(), names.end(), name) = new_name;
            result_.rename.emplace_back(name, new_name);
        };
        while (!open.empty()) {
            const auto free = std::find_if(open.begin(), open.end(), [&names](const auto & each) {
                return each.second == each.first || !is_among(names, each.second);
            });
            if (free != open.end()) {
                do_one(free->first, free->second);
                open.erase(free);
                continue;
            }
            const std::string aside = free_name(names);
            // One whose place nobody waits for can't step aside usefully: its new name stays taken.
            const auto waiting = std::find_if(open.begin(), open.end(), [&open](const auto & each) {
                return std::any_of(open.begin(), open.end(),
                                   [&each](const auto & other) { return other.second == each.first; });
            });
            if (waiting == open.end())
                refuse(subject_, fmt::format("two columns would have the name \"{}\"", open.front().second),
                       RG_E_DUPLICATE_COLUMN);
            do_one(waiting->first, aside);
            waiting->first = aside;
        }
    }

    static std::string free_name(const std::vector<std::string> & names)
    {
        std::string name = "renaming";
        while (is_among(names, name))
            name += '_';
        return name;
    }

    const std::vector<column> &                      columns_;
    const std::string &                              subject_;
    std::vector<std::pair<std::string, std::string>> renames_; // as they are asked for
    column_changes                                   result_;
};

} // namespace

column_changes changes_for(const alter_options & options, const std::vector<column> & columns,
                           const std::string & subject)
{
    if (options.add.empty() && options.drop.empty() && options.rename.empty() && options.defaults.empty())
        throw failure(exit_code::usage, subject, "alter wants --add, --drop, --rename or --default");
    planner plan(columns, subject);
    for (const std::string & name : options.drop)
        plan.drop(name);
    for (const std::string & text : options.defaults)
        plan.set_default(text);
    for (const std::string & text : options.rename)
        plan.rename(text);
    for (const std::string & text : options.add)
        for (const column & added : parse_columns(text))
            plan.add(added);
    return plan.finish();
}

} // namespace ktrg
