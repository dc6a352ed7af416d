// SPDX-License-Identifier: MIT
// place: where a table is: what the user names, as a directory, a file and a registry path.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace ktrg
{

// The tool mounts the table's directory here, in a tree of its own, and the directory that a table goes to beside it.
inline constexpr const char * mount_point        = "/t";
inline constexpr const char * target_mount_point = "/u";

struct place {
    std::string                  name;      // as the user wrote it, without @COUNTER: for messages
    std::string                  directory; // "." if the name has no "/" and KTRG_ROOT isn't set
    std::string                  file_name; // in that directory
    std::string                  file;      // path of the table's file
    std::string                  mounted_at = mount_point;
    std::string                  registry_path; // below it, with "/" for each "," of the file's name
    std::optional<std::uint64_t> counter;       // of TABLE@COUNTER
};

// Throws a usage failure for what no registry path can name.
[[nodiscard]] place find_place(const std::string & table);

// The registry path of a file in a directory that is mounted there: with "/" for each "," of the file's name.
[[nodiscard]] std::string registry_path_at(const std::string & mounted_at, const std::string & file_name);

// The directory that names without "/" are looked for in.
[[nodiscard]] std::string root_directory();

// Whether a file of this name can be a table.
[[nodiscard]] bool is_table_file_name(const std::string & file_name);

[[nodiscard]] bool is_directory(const std::string & path);

// The names of all files in the directory, in order.
[[nodiscard]] std::vector<std::string> files_in(const std::string & directory);

// The names of the files in the directory that begin like tables, in order; as `name`s of places in that directory.
[[nodiscard]] std::vector<std::string> tables_in(const std::string & directory);

// The failure for a table that isn't there, with a near name and the way out.
class failure;
[[nodiscard]] failure no_such_table(const place & where);

} // namespace ktrg
