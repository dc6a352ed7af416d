// SPDX-License-Identifier: MIT
// rg_i_trace: how a failure is reported, and the trace of the exported calls.
//
// The deepest place reports, once: it sets the error record and, if the Errors level asks for it, makes a trace event.
// Everybody above passes the code up unchanged. The functions here use the stack alone, so they run under any lock.
#pragma once

#include <atomic>

#include "kt_rg.h"
#include "kt_tr.h"

// The place that reports. RG_HERE captures it; don't use it inside a lambda, where __func__ is "operator()".
struct rg_i_site_t {
    const kt_char_t * p_function;
    kt_int32_t        line;
    const kt_char_t * p_source_file;
    const kt_char_t * p_version;
};

// Each module that reports has `constexpr char module_version[]` in its unnamed namespace.
#define RG_HERE (rg_i_site_t{__func__, __LINE__, __FILE_NAME__, module_version})

extern tr_detail_level_t         Rg_Trace_Level_Of_Detail[3]; // written by the trace library, read without a lock
extern tr_category_description_t Rg_Trace_Categories[3];
extern kt_uint32_t               Rg_Library_Registered_For_Trace;

inline constexpr kt_char_t RG_I_TRACE_COMPONENT[] = "_RGA";
enum { RG_I_TRACE_API = 0, RG_I_TRACE_ERRORS = 1, RG_I_TRACE_WHEREVER = 2 };

// Whether events of the category are wanted. Read without a lock on purpose: a stale byte costs an event, or one too
// many.
[[nodiscard]] inline bool rg_i_traces(kt_uint32_t category)
{
    return std::atomic_ref(Rg_Trace_Level_Of_Detail[category]).load(std::memory_order_relaxed) != 0;
}

// Registers the component on the first call of the process.
void rg_i_register_for_trace();

// ---- Reporting a failure: each sets the record, traces, and returns the code ----

// A code whose text has no arguments; the message index follows from the code (202 and 213 to 215 carry index 19).
[[nodiscard]] kt_int32_t rg_i_fail(const rg_i_site_t & site, kt_int32_t code);
[[nodiscard]] kt_int32_t rg_i_fail_system_call(const rg_i_site_t & site, const kt_char_t * p_call,
                                               kt_int32_t the_errno);
[[nodiscard]] kt_int32_t rg_i_fail_library_call(const rg_i_site_t & site, const kt_char_t * p_call, kt_int32_t result);
[[nodiscard]] kt_int32_t rg_i_fail_no_memory(const rg_i_site_t & site);
[[nodiscard]] kt_int32_t rg_i_fail_internal(const rg_i_site_t & site);
// RG_E_INVALID_PATH; a NULL path is shown as "<NULL POINTER>".
[[nodiscard]] kt_int32_t rg_i_fail_invalid_path(const rg_i_site_t & site, const kt_char_t * p_path);
// RG_E_INVALID_VARIABLE_TYPE, with the criteria in the message.
[[nodiscard]] kt_int32_t rg_i_fail_invalid_variable(const rg_i_site_t & site, const kt_char_t * p_text);

// Last witness of a failing flush: one line in the file reginfo_pid.<pid> of the working directory. Never fails.
void rg_i_capture_errno(char * p_function_name, int the_errno, int line_number, char * p_sccsid);

// The mounted file system that holds the path: its device and directory, into buffers of RG_I_MOUNT_TEXT_SIZE bytes.
// -1 if the table of mounts can't be read; the texts are "UNKNOWN" then. The second form reads /etc/mtab.
inline constexpr int RG_I_MOUNT_TEXT_SIZE = 4096;
int rg_i_find_filesystem(const char * p_table_of_mounts, const char * path, char * device, char * mount_directory);
int get_filesystem_containing_file(char * path, char * device, char * mount_directory);

// Sets the record of code 16; the caller returns the code. Without a site, the record of the error's place names the
// function itself.
void trace_filesystem_full_for_path(const rg_i_site_t & site, char * p_path);
void trace_filesystem_full_for_path(char * p_path);
// Sets the record of code 202 with the rendered key; the caller returns the code. The table's name may be NULL.
void trace_key_not_found(const rg_i_site_t & site, char * p_table_name, kt_value_t value, kt_data_type_t type);
void trace_key_not_found(char * p_table_name, kt_value_t value, kt_data_type_t type);
