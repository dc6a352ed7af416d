// SPDX-License-Identifier: MIT
// place: the mapping between files and registry paths, from the outside.
//
// A registry path may hold letters, digits, '_' and '/', and its file's name has ',' for each '/'. So a file name that
// holds anything else, or in which a ',' would make an empty component, belongs to no table.
#include "place.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <cstring>

#include <dirent.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include "failure.h"
#include "kt_rg.h"
#include "table_file.h"

namespace ktrg
{

namespace
{

constexpr std::size_t longest_registry_path = 255;

bool is_name_character(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' || c == ',';
}

// Takes @COUNTER off the end of the text.
std::optional<std::uint64_t> take_counter(std::string & table)
{
    const std::size_t at = table.rfind('@');
    if (at == std::string::npos || table.find('/', at) != std::string::npos)
        return std::nullopt;
    std::uint64_t     counter = 0;
    const std::string digits  = table.substr(at + 1);
    const auto [p_end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), counter);
    if (digits.empty() || error != std::errc() || p_end != digits.data() + digits.size())
        throw failure(exit_code::usage, table, "behind \"@\" goes a change counter, as in hosts@1041");
    table.resize(at);
    return counter;
}

} // namespace

std::string root_directory()
{
    const char * p_root = std::getenv("KTRG_ROOT");
    return p_root != nullptr && *p_root != '\0' ? p_root : ".";
}

bool is_table_file_name(const std::string & file_name)
{
    return !file_name.empty() && file_name[0] != ',' && file_name.find(",,") == std::string::npos &&
           file_name.size() + std::strlen(mount_point) + 1 <= longest_registry_path &&
           std::all_of(file_name.begin(), file_name.end(), is_name_character);
}

std::string registry_path_at(const std::string & mounted_at, const std::string & file_name)
{
    std::string path = mounted_at + "/" + file_name;
    std::replace(path.begin() + static_cast<std::ptrdiff_t>(mounted_at.size()), path.end(), ',', '/');
    return path;
}

place find_place(const std::string & table)
{
    place             result;
    std::string       path  = table;
    const auto        count = take_counter(path);
    const std::size_t slash = path.rfind('/');
    result.name             = path;
    result.counter          = count;
    result.directory = slash == std::string::npos ? root_directory() : path.substr(0, std::max<std::size_t>(slash, 1));
    const std::string file_name = slash == std::string::npos ? path : path.substr(slash + 1);

    result.file = result.directory + (result.directory.ends_with('/') ? "" : "/") + file_name;
    if (file_name.empty() || is_directory(result.file))
        throw failure(exit_code::usage, table,
                      fmt::format("a directory, not a table; `ktrg ls {}` lists its tables", path));
    if (!is_table_file_name(file_name))
        throw failure(exit_code::usage, table,
                      "no table can have this name: it is made of letters, digits and \"_\", with \",\" between its "
                      "components",
                      RG_E_INVALID_PATH);
    result.file_name     = file_name;
    result.registry_path = registry_path_at(mount_point, file_name);
    return result;
}

bool is_directory(const std::string & path)
{
    struct stat status {
    };
    return stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

std::vector<std::string> files_in(const std::string & directory)
{
    DIR * p_directory = opendir(directory.c_str());
    if (p_directory == nullptr) {
        if (errno == ENOENT || errno == ENOTDIR)
            throw failure(exit_code::not_found, directory, "no such directory");
        if (errno == EACCES)
            throw failure(exit_code::not_permitted, directory, "permission denied", RG_E_ACCESS);
        throw failure(exit_code::input_output, directory, std::strerror(errno), RG_E_SYSTEM_CALL);
    }
    std::vector<std::string> names;
    while (const dirent * p_entry = readdir(p_directory))
        names.emplace_back(p_entry->d_name);
    closedir(p_directory);
    std::sort(names.begin(), names.end());
    return names;
}

std::vector<std::string> tables_in(const std::string & directory)
{
    std::vector<std::string> names = files_in(directory);
    std::erase_if(names, [&directory](const std::string & name) {
        return !is_table_file_name(name) || !looks_like_table(directory + "/" + name);
    });
    return names;
}

failure no_such_table(const place & where)
{
    struct stat status {
    };
    if (stat(where.directory.c_str(), &status) != 0 && errno == ENOENT)
        return failure(exit_code::not_found, where.name, fmt::format("no directory {}", in_quotes(where.directory)),
                       RG_E_NO_SUCH_TABLE);
    std::string hint;
    try {
        const std::size_t slash     = where.name.rfind('/');
        const std::string prefix    = slash == std::string::npos ? "" : where.name.substr(0, slash + 1);
        const std::string candidate = closest(where.name.substr(prefix.size()), tables_in(where.directory));
        if (!candidate.empty())
            hint = fmt::format(" (did you mean \"{}{}\"?)", prefix, candidate);
    } catch (const failure &) {
        hint.clear(); // a hint isn't worth a failure of its own
    }
    return failure(exit_code::not_found, where.name, "no such table" + hint, RG_E_NO_SUCH_TABLE);
}

} // namespace ktrg
