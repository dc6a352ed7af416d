// SPDX-License-Identifier: MIT
// rg_i_paths: registry paths: what they may hold, and which file of which directory they name.
//
// Layer: frame. Called by every operation that takes a registry path.
// Always holds: a resolved path is either the caller's own (a transient table) or a new allocation (a file's path) with
// room behind it for the suffix of a rewrite file. "," can't occur in a registry path, so that file names lead back.
// Locking: the caller holds the tree's write lock where a tree is searched.
// Failure: nothing is kept; directories made before a failure stay.
#include <sys/stat.h>

#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "rg_i_trace.h"
#include "rg_i_tree.h"

namespace
{

constexpr char module_version[] = "rg_i_paths 1.0";

constexpr size_t MAXIMUM_PATH_LENGTH = 255;
constexpr size_t ROOM_FOR_SUFFIX     = 32; // callers append ".rewrite" in place
constexpr mode_t DIRECTORY_MODE      = 0755;

bool character_is_allowed(char c)
{
    const int byte = static_cast<unsigned char>(c);
    return std::isspace(byte) == 0 && (std::isalnum(byte) != 0 || c == '_' || c == '/');
}

bool all_characters_are_allowed(const kt_char_t * p_path)
{
    for (; *p_path != '\0'; ++p_path)
        if (!character_is_allowed(*p_path))
            return false;
    return true;
}

bool ends_in_a_dot_component(const kt_char_t * p_path)
{
    const kt_char_t * p_last = std::strrchr(p_path, '/');
    return p_last != nullptr && (std::strcmp(p_last, "/.") == 0 || std::strcmp(p_last, "/..") == 0);
}

// Of these only "//" can occur behind the test of the characters. The others stay, as a second door that a wider set of
// characters would have to pass.
bool components_are_allowed(const kt_char_t * p_path)
{
    return std::strchr(p_path, ',') == nullptr && std::strstr(p_path, "//") == nullptr &&
           std::strstr(p_path, "/./") == nullptr && std::strstr(p_path, "/../") == nullptr &&
           !ends_in_a_dot_component(p_path);
}

bool path_is_allowed(const kt_char_t * p_path)
{
    const size_t length = strnlen(p_path, MAXIMUM_PATH_LENGTH + 1);
    return length > 0 && length <= MAXIMUM_PATH_LENGTH && all_characters_are_allowed(p_path) &&
           components_are_allowed(p_path);
}

const rg_i_mount_point_t * element_of(void * p_node)
{
    return p_node == nullptr ? nullptr : *static_cast<rg_i_mount_point_t **>(p_node);
}

// A mount point may be made above an existing one, and the search for a path that begins with the upper one alone can
// then turn off at the lower one. So where the search finds nothing, each beginning that ends in "/" is looked up.
const rg_i_mount_point_t * find_by_beginnings(void * const * p_mount_points, const kt_char_t * p_path)
{
    kt_char_t beginning[MAXIMUM_PATH_LENGTH + 1];
    for (size_t length = 0; p_path[length] != '\0'; ++length) {
        beginning[length] = p_path[length];
        if (p_path[length] != '/')
            continue;
        beginning[length + 1] = '\0';
        if (const auto * p_found =
                element_of(tfind(beginning, p_mount_points, rg_i_string_to_mount_point_delete_compare));
            p_found != nullptr)
            return p_found;
    }
    return nullptr;
}

// The path of the file: the mount's directory, and the rest of the registry path with every "/" but the first made ",".
[[nodiscard]] kt_char_ptr_t make_file_path(const rg_i_mount_point_t & mount_point, const kt_char_t * p_registry_path)
{
    const kt_char_t * p_rest           = p_registry_path + std::strlen(mount_point.p_name) - 1;
    const size_t      directory_length = std::strlen(mount_point.p_filesystem_path);
    const size_t      rest_length      = std::strlen(p_rest);
    auto * p_file_path = static_cast<kt_char_t *>(std::malloc(directory_length + rest_length + ROOM_FOR_SUFFIX));
    if (p_file_path == nullptr)
        return nullptr;

    std::memcpy(p_file_path, mount_point.p_filesystem_path, directory_length);
    std::memcpy(p_file_path + directory_length, p_rest, rest_length + 1);
    for (kt_char_t * p = p_file_path + directory_length + 1; *p != '\0'; ++p)
        if (*p == '/')
            *p = ',';
    return p_file_path;
}

// 0 if the directory is there afterwards, else the errno.
int make_directory(const kt_char_t * p_path)
{
    return mkdir(p_path, DIRECTORY_MODE) == 0 || errno == EEXIST ? 0 : errno;
}

// 0, or the errno of the first directory that couldn't be made.
int make_directories(kt_char_t * p_path)
{
    if (*p_path != '\0')
        for (kt_char_t * p = p_path + 1; *p != '\0'; ++p) {
            if (*p != '/')
                continue;
            *p                  = '\0';
            const int the_errno = make_directory(p_path);
            *p                  = '/';
            if (the_errno != 0)
                return the_errno;
        }
    return make_directory(p_path);
}

} // namespace

kt_int32_t rg_i_check_path_syntax(kt_char_ptr_t p_path)
{
    return p_path != nullptr && path_is_allowed(p_path) ? 0 : rg_i_fail_invalid_path(RG_HERE, p_path);
}

const rg_i_mount_point_t * rg_i_find_mount_point(const rg_i_tree_t * p_tree, const kt_char_t * p_path)
{
    const auto * p_found = element_of(tfind(p_path, &p_tree->p_mount_points, rg_i_string_to_mount_point_compare));
    return p_found != nullptr ? p_found : find_by_beginnings(&p_tree->p_mount_points, p_path);
}

kt_int32_t rg_i_resolve_path(rg_i_tree_t * p_tree, kt_char_ptr_t p_registry_path,
                             kt_char_ptr_t * p_absolute_registry_path, kt_uint32_t * p_persistent)
{
    if (const kt_int32_t rc = rg_i_check_path_syntax(p_registry_path); rc != 0)
        return rc;

    const rg_i_mount_point_t * p_mount_point = rg_i_find_mount_point(p_tree, p_registry_path);
    if (p_mount_point == nullptr) {
        *p_absolute_registry_path = p_registry_path;
        *p_persistent             = 0;
        return 0;
    }

    const kt_char_ptr_t p_file_path = make_file_path(*p_mount_point, p_registry_path);
    if (p_file_path == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    *p_absolute_registry_path = p_file_path;
    *p_persistent             = p_mount_point->block_size;
    return 0;
}

kt_int32_t rg_i_create_all_directories_in_path(kt_char_ptr_t p_path)
{
    const int the_errno = make_directories(p_path);
    if (the_errno == 0)
        return 0;
    if (the_errno == ENOSPC) {
        trace_filesystem_full_for_path(RG_HERE, p_path);
        return RG_E_FILESYSTEM_FULL_DETAIL;
    }
    return rg_i_fail_system_call(RG_HERE, "mkdir", the_errno);
}
