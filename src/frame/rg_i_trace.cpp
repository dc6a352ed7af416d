// SPDX-License-Identifier: MIT
// rg_i_trace: the error record and the trace events of every failure.
//
// Layer: frame, below everything that can fail. Calls the utility library and the trace library only.
// Always holds: the record is set whether or not anybody traces; the event follows only if the Errors level asks.
// Locking: none; runs under any lock, with buffers on the stack. The level bytes are read without a lock.
// Failure: none of its own. A table of mounts that can't be read leaves "UNKNOWN" in the message.
#include "rg_i_trace.h"

#include <unistd.h>

#include <array>
#include <cassert>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "kt_ku.h"
#include "rg_i_messages.h"

tr_detail_level_t Rg_Trace_Level_Of_Detail[3];
kt_uint32_t       Rg_Library_Registered_For_Trace;

tr_category_description_t Rg_Trace_Categories[3] = {
    {RG_I_TRACE_API, const_cast<kt_char_t *>("API"), 0, 0},
    {RG_I_TRACE_ERRORS, const_cast<kt_char_t *>("Errors"), 0, 0},
    {RG_I_TRACE_WHEREVER, const_cast<kt_char_t *>("Wherever"), 0, 0}, // registered, and never tested
};

namespace
{

constexpr char module_version[] = "rg_i_trace 1.0";

enum { FILESYSTEM_FULL_EVENT = 119, KEY_NOT_FOUND_EVENT = 120 };

// Message index by code; 0 where there is no such code.
using index_table = std::array<kt_uint8_t, RG_E_NO_COMMIT_RECORD + 1>;

constexpr index_table make_index_table()
{
    index_table table{};
    for (const rg_i_message_t & message : RG_I_MESSAGES) {
        kt_uint8_t & index = table[static_cast<size_t>(message.code)];
        if (index == 0)
            index = static_cast<kt_uint8_t>(message.index);
    }
    // Kept because callers depend on it: what makes a file unreadable at an open is told as a missing key.
    table[RG_E_BAD_REPLACES_OFFSET]    = RG_I_MESSAGE_NO_SUCH_KEY;
    table[RG_E_BAD_DELETED_ROW_OFFSET] = RG_I_MESSAGE_NO_SUCH_KEY;
    table[RG_E_NO_COMMIT_RECORD]       = RG_I_MESSAGE_NO_SUCH_KEY;
    return table;
}

constexpr index_table MESSAGE_INDICES = make_index_table();

static_assert(MESSAGE_INDICES[0] == 0);
static_assert(MESSAGE_INDICES[RG_E_SYSTEM_CALL] == RG_I_MESSAGE_SYSTEM_CALL);
static_assert(MESSAGE_INDICES[RG_E_LIBRARY_CALL] == RG_I_MESSAGE_LIBRARY_CALL);
static_assert(MESSAGE_INDICES[RG_E_NO_MEMORY] == RG_I_MESSAGE_NO_MEMORY);
static_assert(MESSAGE_INDICES[RG_E_INTERNAL] == RG_I_MESSAGE_INTERNAL);
static_assert(MESSAGE_INDICES[RG_E_INVALID_PATH] == RG_I_MESSAGE_INVALID_PATH);
static_assert(MESSAGE_INDICES[RG_E_INVALID_VARIABLE_TYPE] == RG_I_MESSAGE_INVALID_VARIABLE);
static_assert(MESSAGE_INDICES[RG_E_FILESYSTEM_FULL_DETAIL] == RG_I_MESSAGE_FILESYSTEM_FULL_DETAIL);
static_assert(MESSAGE_INDICES[RG_E_NO_SUCH_KEY] == RG_I_MESSAGE_NO_SUCH_KEY, "the text with a key in it is explicit");
static_assert(MESSAGE_INDICES[RG_E_APPLIED_UNCOMMITTED] == 29);

// Sets the record, always; the arguments are those of the message.
template <class... Arguments> void set_record(kt_int32_t code, kt_int32_t message_index, Arguments... arguments)
{
    ku_set_error_1(code, 0, RG_I_MESSAGE_CATALOG, RG_I_MESSAGE_SET, message_index, ku_mesgtbl_kt_rg_set[message_index],
                   arguments...);
}

void trace_location(const rg_i_site_t & site)
{
    if (rg_i_traces(RG_I_TRACE_ERRORS))
        tr_record_error_1(RG_I_TRACE_COMPONENT, 0, site.p_function, static_cast<kt_uint32_t>(site.line),
                          site.p_source_file, 0);
}

void trace_strings(kt_uint32_t id, const kt_char_t * p_string1, const kt_char_t * p_string2)
{
    if (rg_i_traces(RG_I_TRACE_ERRORS))
        tr_record_strings_1(RG_I_TRACE_COMPONENT, id, 2, p_string1, p_string2);
}

template <class... Arguments>
kt_int32_t fail_with(const rg_i_site_t & site, kt_int32_t code, kt_int32_t message_index, Arguments... arguments)
{
    set_record(code, message_index, arguments...);
    trace_location(site);
    return code;
}

} // namespace

void rg_i_register_for_trace()
{
    // Tested and set without a lock: two threads that open their first trees at once both register, which does no harm.
    const std::atomic_ref registered(Rg_Library_Registered_For_Trace);
    if (registered.load(std::memory_order_relaxed) == 0) {
        tr_register_component_1(RG_I_TRACE_COMPONENT, Rg_Trace_Level_Of_Detail, Rg_Trace_Categories, 3);
        registered.store(1, std::memory_order_relaxed);
    }
}

kt_int32_t rg_i_fail(const rg_i_site_t & site, kt_int32_t code)
{
    const kt_int32_t message_index = MESSAGE_INDICES[static_cast<size_t>(code)];
    assert(message_index != 0);
    assert(std::strchr(ku_mesgtbl_kt_rg_set[message_index], '%') == nullptr); // those have functions of their own
    return fail_with(site, code, message_index);
}

kt_int32_t rg_i_fail_system_call(const rg_i_site_t & site, const kt_char_t * p_call, kt_int32_t the_errno)
{
    return fail_with(site, RG_E_SYSTEM_CALL, RG_I_MESSAGE_SYSTEM_CALL, p_call, the_errno, site.p_function, site.line,
                     site.p_source_file, site.p_version);
}

kt_int32_t rg_i_fail_library_call(const rg_i_site_t & site, const kt_char_t * p_call, kt_int32_t result)
{
    return fail_with(site, RG_E_LIBRARY_CALL, RG_I_MESSAGE_LIBRARY_CALL, p_call, result, site.p_function, site.line,
                     site.p_source_file, site.p_version);
}

kt_int32_t rg_i_fail_no_memory(const rg_i_site_t & site)
{
    return fail_with(site, RG_E_NO_MEMORY, RG_I_MESSAGE_NO_MEMORY, site.p_function, site.line, site.p_source_file,
                     site.p_version);
}

kt_int32_t rg_i_fail_internal(const rg_i_site_t & site)
{
    return fail_with(site, RG_E_INTERNAL, RG_I_MESSAGE_INTERNAL, site.p_function, site.line, site.p_source_file,
                     site.p_version);
}

kt_int32_t rg_i_fail_invalid_path(const rg_i_site_t & site, const kt_char_t * p_path)
{
    return fail_with(site, RG_E_INVALID_PATH, RG_I_MESSAGE_INVALID_PATH, p_path != nullptr ? p_path : "<NULL POINTER>");
}

kt_int32_t rg_i_fail_invalid_variable(const rg_i_site_t & site, const kt_char_t * p_text)
{
    return fail_with(site, RG_E_INVALID_VARIABLE_TYPE, RG_I_MESSAGE_INVALID_VARIABLE, p_text);
}

void rg_i_capture_errno(char * p_function_name, int the_errno, int line_number, char * p_sccsid)
{
    const int saved = errno; // the caller has yet to report it
    char      file_name[256];
    std::snprintf(file_name, sizeof file_name, "reginfo_pid.%u", static_cast<unsigned>(getpid()));
    if (std::FILE * p_file = std::fopen(file_name, "we"); p_file != nullptr) {
        std::fprintf(p_file, "function(%s) errno(%d) line(%d) sccsid(%s)\n", p_function_name, the_errno, line_number,
                     p_sccsid);
        std::fflush(p_file);
        std::fclose(p_file);
    }
    errno = saved;
}

// ---- A full file system ----

namespace
{

struct mount_line_t {
    char device[RG_I_MOUNT_TEXT_SIZE];
    char directory[RG_I_MOUNT_TEXT_SIZE];
};

// False if the line doesn't yield three fields.
bool split_line(const char * p_line, mount_line_t & mount)
{
    char rest[RG_I_MOUNT_TEXT_SIZE];
    return std::sscanf(p_line, "%4095s %4095s %4095s\n", mount.device, mount.directory, rest) == 3;
}

// Whether the path is the directory or lies in it. A name that merely begins alike doesn't.
bool lies_in(const char * path, const char * directory, size_t directory_length)
{
    return std::strncmp(path, directory, directory_length) == 0 &&
           (path[directory_length] == '/' || path[directory_length] == '\0');
}

} // namespace

int rg_i_find_filesystem(const char * p_table_of_mounts, const char * path, char * device, char * mount_directory)
{
    std::strcpy(device, "UNKNOWN");
    std::strcpy(mount_directory, "UNKNOWN");
    std::FILE * p_file = std::fopen(p_table_of_mounts, "re");
    if (p_file == nullptr)
        return -1;

    char         root_device[RG_I_MOUNT_TEXT_SIZE] = "UNKNOWN";
    size_t       best_length                       = 0;
    char         line[RG_I_MOUNT_TEXT_SIZE];
    mount_line_t mount;
    while (std::fgets(line, sizeof line, p_file) != nullptr) {
        if (!split_line(line, mount))
            continue;
        if (std::strcmp(mount.directory, "/") == 0) {
            std::strcpy(root_device, mount.device); // the last such line stands: it is mounted over the others
            continue;
        }
        const size_t length = std::strlen(mount.directory);
        if (length > best_length && lies_in(path, mount.directory, length)) {
            best_length = length;
            std::strcpy(device, mount.device);
            std::strcpy(mount_directory, mount.directory);
        }
    }
    std::fclose(p_file);

    if (best_length == 0) {
        std::strcpy(device, root_device);
        std::strcpy(mount_directory, "/");
    }
    return 0;
}

int get_filesystem_containing_file(char * path, char * device, char * mount_directory)
{
    return rg_i_find_filesystem("/etc/mtab", path, device, mount_directory);
}

void trace_filesystem_full_for_path(const rg_i_site_t & site, char * p_path)
{
    char device[RG_I_MOUNT_TEXT_SIZE];
    char mount_directory[RG_I_MOUNT_TEXT_SIZE];
    get_filesystem_containing_file(p_path, device, mount_directory);
    set_record(RG_E_FILESYSTEM_FULL_DETAIL, RG_I_MESSAGE_FILESYSTEM_FULL_DETAIL, device, mount_directory);
    trace_strings(FILESYSTEM_FULL_EVENT, device, mount_directory);
    trace_location(site);
}

void trace_filesystem_full_for_path(char * p_path)
{
    trace_filesystem_full_for_path(RG_HERE, p_path);
}

// ---- A missing key ----

namespace
{

using key_text = char[256];

void render_string(const kt_char_t * p_string, key_text & text)
{
    std::strncpy(text, p_string != nullptr ? p_string : ku_ptr_empty_char_1, sizeof text - 1);
    text[sizeof text - 1] = '\0';
}

void render_resource_handle(const kt_resource_handle_t * p_handle, key_text & text)
{
    kt_resource_handle_t handle; // the caller's may lie at any address
    std::memcpy(&handle, p_handle != nullptr ? p_handle : ku_ptr_invld_rsrc_hndl_1, sizeof handle);
    kt_uint16_t header[2];
    std::memcpy(header, &handle.header, sizeof header);
    std::snprintf(text, sizeof text, "0x%04x 0x%04x 0x%08x 0x%08x 0x%08x 0x%08x", header[0], header[1], handle.id.id1,
                  handle.id.id2, handle.id.id3, handle.id.id4);
}

void render_key(const kt_value_t & value, kt_data_type_t type, key_text & text)
{
    switch (type) {
    case KT_INT32:
        std::snprintf(text, sizeof text, "%d", value.val_int32);
        break;
    case KT_UINT32:
        std::snprintf(text, sizeof text, "%u", value.val_uint32);
        break;
    case KT_INT64:
        std::snprintf(text, sizeof text, "%lld", static_cast<long long>(value.val_int64));
        break;
    case KT_UINT64:
        std::snprintf(text, sizeof text, "%llu", static_cast<unsigned long long>(value.val_uint64));
        break;
    case KT_FLOAT32:
        std::snprintf(text, sizeof text, "%g", static_cast<double>(value.val_float32));
        break;
    case KT_FLOAT64:
        std::snprintf(text, sizeof text, "%lg", value.val_float64);
        break;
    case KT_CHAR_PTR:
        render_string(value.ptr_char, text);
        break;
    case KT_RSRC_HANDLE_PTR:
        render_resource_handle(value.ptr_rsrc_handle, text);
        break;
    default:
        std::strcpy(text, "***UNKNOWN KEY TYPE****");
        break;
    }
}

} // namespace

void trace_key_not_found(const rg_i_site_t & site, char * p_table_name, kt_value_t value, kt_data_type_t type)
{
    key_text key;
    render_key(value, type, key);
    const kt_char_t * p_shown_name = p_table_name != nullptr ? p_table_name : "(UNKNOWN_TABLE_NAME)";
    set_record(RG_E_NO_SUCH_KEY, RG_I_MESSAGE_NO_SUCH_KEY_DETAIL, static_cast<const kt_char_t *>(key), p_shown_name);
    trace_strings(KEY_NOT_FOUND_EVENT, key, p_shown_name);
    trace_location(site);
}

void trace_key_not_found(char * p_table_name, kt_value_t value, kt_data_type_t type)
{
    trace_key_not_found(RG_HERE, p_table_name, value, type);
}
