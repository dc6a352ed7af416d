/* SPDX-License-Identifier: MIT
 *
 * kt_rg.h: the registry: a small, embedded, transactional store of typed tables.
 *
 * Valid C11 and C++. Every function returns 0 or one of the RG_E_ codes; ku_get_error_record_1 (kt_ku.h) then holds the
 * message. Any thread may call any function, but a handle may not be closed while another thread uses it, and a caller
 * must not have a thread cancelled inside a call. What each call does on bad input is told in docs/BAD-INPUT.md.
 */
#ifndef KT_RG_H
#define KT_RG_H

#include <stdarg.h>
#include <stdio.h>

#include "kt_types.h"

#ifdef __cplusplus
extern "C" {
#endif
#pragma GCC visibility push(default)

/* ---- Result codes ---------------------------------------------------------------------------------------------- */

enum {
    /* Faults of the environment or of the library. */
    RG_E_SYSTEM_CALL            = 10,
    RG_E_LIBRARY_CALL           = 11,
    RG_E_NO_MEMORY              = 12,
    RG_E_FILESYSTEM_FULL        = 13,
    RG_E_TABLE_UNREADABLE       = 14,
    RG_E_INTERNAL               = 15,
    RG_E_FILESYSTEM_FULL_DETAIL = 16,
    /* Mistakes in the call. */
    RG_E_INVALID_HANDLE        = 100,
    RG_E_NULL_POINTER          = 101,
    RG_E_INVALID_PATH          = 102,
    RG_E_INVALID_MODE          = 103,
    RG_E_NO_COLUMNS            = 104,
    RG_E_INVALID_COLUMN        = 105,
    RG_E_DUPLICATE_COLUMN      = 106,
    RG_E_KEY_EXPECTED          = 107,
    RG_E_DUPLICATE_KEY         = 108,
    RG_E_INVALID_VARIABLE_TYPE = 109,
    /* States of the registry. */
    RG_E_NO_SUCH_TABLE          = 200,
    RG_E_TABLE_EXISTS           = 201,
    RG_E_NO_SUCH_KEY            = 202,
    RG_E_NO_SUCH_INDEX          = 203,
    RG_E_ROW_DELETED            = 204,
    RG_E_NO_ROWS_TO_DELETE      = 205,
    RG_E_ACCESS                 = 206,
    RG_E_MOUNT_POINT_EXISTS     = 207,
    RG_E_NO_SUCH_MOUNT_POINT    = 208,
    RG_E_UNCOMMITTED_TABLE      = 209,
    RG_E_UNAPPLIED_TABLE        = 210,
    RG_E_EXCLUSIVE_OPEN         = 211,
    RG_E_APPLIED_UNCOMMITTED    = 212,
    RG_E_BAD_REPLACES_OFFSET    = 213,
    RG_E_BAD_DELETED_ROW_OFFSET = 214,
    RG_E_NO_COMMIT_RECORD       = 215
};

/* The default texts of the messages, by message index (not by code): what the error record's text is made of where no
 * catalog kt_rg.cat is found for the process's locale. Each but the filler at index 0 ends in a newline. Conversions
 * carry positions, as in %1$s. Constant: never write to the array or to its texts. */
enum { RG_TOTAL_MESSAGES = 32 };
extern kt_char_ptr_t ku_mesgtbl_kt_rg_set[RG_TOTAL_MESSAGES];

/* ---- Shared types ---------------------------------------------------------------------------------------------- */

/* The address of a tree or of a table. NULL is refused with RG_E_INVALID_HANDLE; any other wrong value is not noticed.
 */
typedef void * rg_opaque_handle_t;

/* How a table is opened or created: READ and WRITE say what for, EXPLICIT_CONTROL that the caller itself applies and
 * commits; without it each update is applied and committed before its call returns. */
enum { RG_MODE_READ = 1, RG_MODE_WRITE = 2, RG_MODE_EXPLICIT_CONTROL = 4 };

/* What a column is: a kind in the low four bits, and modifier bits. Stands in files and on the wire: never renumber. */
typedef kt_uint32_t rg_qualifier_t;
enum {
    RG_UNKNOWN_QUALIFIER   = 0,
    RG_SYSTEM              = 1,
    RG_STANDARD            = 2,
    RG_PRIMARY_KEY         = 3,
    RG_PRIMARY_KEY_NOCHECK = 4,

    RG_PROTECTED                       = 16,
    RG_INVISIBLE                       = 32,
    RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED = 64
};

/* What stands of a row: see docs/ARCHITECTURE.md. */
typedef kt_uint32_t rg_row_state_t;
enum {
    RG_ROW_STATE_COMMITTED = 0,
    RG_ROW_STATE_ADDED     = 1,
    RG_ROW_STATE_UPDATED   = 2,
    RG_ROW_STATE_DELETED   = 3,
    RG_ROW_STATE_NO_ROW    = 4
};

/* The fields of a structured data column. */
typedef struct rg_field_def_t {
    kt_data_type_t type;
    kt_char_ptr_t  name;
} rg_field_def_t;

typedef struct rg_sd_def_t {
    kt_uint32_t    number_of_fields;
    rg_field_def_t fields[1];
} rg_sd_def_t;

/* One column. */
typedef struct rg_column_t {
    kt_char_ptr_t  name; /* 1 to 255 bytes: a letter, then letters, digits and '_' */
    kt_data_type_t type; /* KT_INT32 to KT_SD_PTR_ARRAY */
    rg_qualifier_t qualifier;
    kt_int32_t     properties;    /* carried and not interpreted */
    rg_sd_def_t *  sd_defn;       /* for KT_SD_PTR and KT_SD_PTR_ARRAY; ignored otherwise */
    kt_value_t     default_value; /* a NULL pointer stands for the type's empty value */
} rg_column_t;

KT_STATIC_ASSERT(sizeof(rg_field_def_t) == 16 && offsetof(rg_field_def_t, name) == 8, "rg_field_def_t");
KT_STATIC_ASSERT(offsetof(rg_sd_def_t, fields) == 8, "rg_sd_def_t");
KT_STATIC_ASSERT(sizeof(rg_column_t) == 40 && offsetof(rg_column_t, sd_defn) == 24 &&
                     offsetof(rg_column_t, default_value) == 32,
                 "rg_column_t");

/* Maps a key to a bucket below the bucket count that the table was given. The key is the address of the value for a
 * scalar key, and the string or the handle itself for the others. */
typedef kt_uint32_t rg_hash_function_t(void * p_key);
/* 0 if the two keys are equal. */
typedef kt_int32_t rg_hash_keys_compare_function_t(void * p_key1, void * p_key2);

/* ---- Trees and mount points ------------------------------------------------------------------------------------ */

/* Opens a tree: the object that owns tables and mount points, and that every other call stands on. It starts without
 * either. A process may hold any number of trees; they know nothing of each other, but meet in the files of directories
 * that both mount. The first call of a process also registers the fork handler and the trace component, whatever its
 * argument; a process where the fork handler can't be registered is aborted.
 *
 * tree_handle        receives the handle; untouched on failure. It goes back through rg_close_tree_1.
 * number_of_retries  no effect.
 * timeout            no effect.
 *
 * Returns 0; RG_E_INVALID_HANDLE if tree_handle is NULL; RG_E_NO_MEMORY; RG_E_LIBRARY_CALL if the strings of the
 * process's locale can't be converted; RG_E_SYSTEM_CALL if a mutex fails. On failure nothing stays allocated.
 *
 * Any thread. Also in a forked child. The locale is looked at here once: call setlocale before.
 */
kt_int32_t rg_open_tree_1(rg_opaque_handle_t * tree_handle, kt_uint32_t number_of_retries, kt_uint64_t timeout);

/* Closes a tree and destroys all that is in it: mount points, named tables and selection results, however often they
 * are open. Their handles dangle from then on, and pending updates are dropped; the files of persistent tables stay as
 * their last commit left them.
 *
 * tree_handle  a tree that no thread uses. Must not be closed twice.
 *
 * Returns 0; RG_E_INVALID_HANDLE if tree_handle is NULL; RG_E_SYSTEM_CALL if the tree's lock fails. If the mutex of the
 * trees fails, the result of pthread_mutex_lock comes back as it is, with no error record. In both cases the tree stays
 * whole, and may be closed again.
 *
 * Any thread. Also in a forked child.
 */
kt_int32_t rg_close_tree_1(rg_opaque_handle_t tree_handle);

/* Mounts a directory of the file system: from then on every table whose path goes on behind the mount point is a file
 * in it, named by the rest of the path with each "/" but the first made ",". Other paths name transient tables. The
 * directory is made, with all above it (mode 0755), if it isn't there.
 *
 * tree_handle        the tree.
 * p_registry_path    the mount point: 1 to 255 letters, digits, "_" and "/", without "//". Give it no "/" at the end:
 *                    such a mount point is accepted and never matches a path.
 * p_filesystem_path  the directory. Both texts are copied.
 * create             no effect: the directory is always made.
 *
 * Returns 0; RG_E_INTERNAL in a forked child, with no error record; RG_E_INVALID_HANDLE if tree_handle is NULL;
 * RG_E_NULL_POINTER if p_filesystem_path is NULL; RG_E_INVALID_PATH; RG_E_MOUNT_POINT_EXISTS if the path is a mount
 * point already, or lies below one; RG_E_TABLE_EXISTS if a transient table has that very name;
 * RG_E_FILESYSTEM_FULL_DETAIL or RG_E_SYSTEM_CALL ("mkdir") if a directory can't be made, the ones above it staying;
 * RG_E_NO_MEMORY; RG_E_SYSTEM_CALL if a lock fails. On failure nothing is mounted.
 *
 * Any thread. A mount point made above an existing one is accepted; a path below both belongs to either, so don't.
 */
kt_int32_t rg_mount_local_tree_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                 kt_char_ptr_t p_filesystem_path, kt_int32_t create);

/* Takes a mount point out of a tree. The directory and its files stay, and open tables go on working on theirs.
 *
 * tree_handle      the tree.
 * p_registry_path  the very text that was mounted. With a "/" added to it, it names nothing.
 *
 * Returns 0; RG_E_INVALID_HANDLE if tree_handle is NULL; RG_E_NO_SUCH_MOUNT_POINT if nothing is mounted by that text;
 * RG_E_INVALID_PATH; RG_E_NO_MEMORY; RG_E_SYSTEM_CALL if the tree's lock fails. On failure nothing changes.
 *
 * Any thread. Also in a forked child.
 */
kt_int32_t rg_unmount_local_tree_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path);

/* ---- Creating, opening and closing tables ---------------------------------------------------------------------- */

/* Makes a table at a registry path and opens it for writing. Under a mount point the table gets a file, which is there
 * whole or not at all; elsewhere it lives in the tree's memory until it is deleted or the tree is closed.
 *
 *   p_registry_path  1 to 255 letters, digits, '_' and '/'
 *   p_columns        array_count columns, exactly one of them with a key qualifier. A key is a number, a string or a
 *                    resource handle. The key column becomes column 0 of the table by changing places with the first
 *                    one. The library copies what it keeps, but it writes over the array: the default_value of each
 *                    column of an indirect type (KT_CHAR_PTR to KT_SD_PTR_ARRAY) holds no pointer afterwards, whether
 *                    the creation succeeded or not, unless the columns themselves were refused. Fill those in again
 *                    before the array is used again
 *   mode             0 to 7; only RG_MODE_EXPLICIT_CONTROL counts
 *   p_result_table_handle  gets the handle on success, for rg_close_table_1
 *
 * Returns 0 or, with nothing made:
 *   RG_E_INVALID_HANDLE    tree_handle is NULL
 *   RG_E_NULL_POINTER      p_result_table_handle or p_columns is NULL
 *   RG_E_INVALID_MODE      mode is below 0 or above 7
 *   RG_E_INVALID_PATH      the path can't be one
 *   RG_E_TABLE_EXISTS      the table is in the tree, its file exists, or it can't be told whether it does
 *   RG_E_NO_COLUMNS        array_count is 0
 *   RG_E_INVALID_COLUMN    a name that isn't a letter and up to 254 letters, digits and '_'; a type or qualifier that no
 *                          column can have; structured data without a definition or with a nameless field; a key of a
 *                          type that no key can have
 *   RG_E_KEY_EXPECTED      no key column
 *   RG_E_DUPLICATE_KEY     more than one key column
 *   RG_E_DUPLICATE_COLUMN  two columns of one name
 *   RG_E_LIBRARY_CALL      a default can't be stored: a string that the table's encoding lacks, or a broken record
 *   RG_E_NO_MEMORY         no memory. If it ran out behind the last step of a table with a file, the file is there
 *   RG_E_ACCESS            no permission to make the file
 *   RG_E_FILESYSTEM_FULL_DETAIL, RG_E_SYSTEM_CALL  the file could not be written
 *   RG_E_INTERNAL          in a forked child, without an error record
 * Thread-safe; creations and updates of a process run one at a time. See docs/ARCHITECTURE.md, docs/FILE-FORMAT.md,
 * docs/BAD-INPUT.md. */
kt_int32_t rg_create_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, rg_column_t * p_columns,
                             kt_uint32_t array_count, kt_int32_t mode, rg_opaque_handle_t * p_result_table_handle);
/* The same, for a table whose rows are found by key through a hash table. A table keyed by resource handle has one
 * without this call.
 *
 *   total_hash_buckets  fixed while the table is open; not 0. The hash table isn't part of a file: rg_open_table_1 opens
 *                       the table without one
 *   p_hash_function     gives the bucket of a key, below total_hash_buckets
 *   p_compare_function  0 if two keys are equal
 *
 * The two functions are called with the table locked, so they must not call the library on that table; the address of
 * a key may have any alignment.
 *
 * Returns the codes above, and RG_E_NULL_POINTER, ahead of all but the forked child's code, if total_hash_buckets is 0
 * or a function is NULL. */
kt_int32_t rg_create_hashed_key_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                        rg_column_t * p_columns, kt_uint32_t array_count, kt_int32_t mode,
                                        kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                        rg_hash_keys_compare_function_t * p_compare_function,
                                        rg_opaque_handle_t *              p_result_table_handle);
/* Opens a table that exists: one in the tree's memory, or the file at a path under a mount point. All opens of a table
 * in a tree share one object, so mode and control are the table's, not the handle's:
 *
 *   - a reader that joins changes nothing, and its handle can update if the table is open for writing;
 *   - a writer that joins writers must ask for the same control;
 *   - a writer that joins readers of a table with a file makes everybody a writer: the file is read afresh into the
 *     shared object, without its hash table unless rg_open_hashed_key_table_1 brings one, and row indices are assigned
 *     anew. The application's data stays what the object had, and so does the place that the next apply writes to:
 *     if another process has committed since the table was first opened, an update overwrites what it committed. Who
 *     can't rule that out closes the readers' handles first;
 *   - who opens a transient table that nobody has open decides alone.
 *
 *   mode  RG_MODE_READ, or RG_MODE_WRITE with or without RG_MODE_EXPLICIT_CONTROL; RG_MODE_READ beside
 *         RG_MODE_WRITE means nothing. Opening a file for writing waits until no other process has it open for
 *         writing, with the tree locked; it holds the file's lock until the last handle is closed
 *   p_result_table_handle  gets the handle on success, for rg_close_table_1
 *
 * Returns 0 or:
 *   RG_E_INVALID_HANDLE    tree_handle is NULL
 *   RG_E_NULL_POINTER      p_result_table_handle is NULL
 *   RG_E_INVALID_MODE      mode is 0, 4, 5, below 0 or above 7
 *   RG_E_INVALID_PATH      the path can't be one
 *   RG_E_NO_SUCH_TABLE     no such table in the tree, and no file
 *   RG_E_EXCLUSIVE_OPEN    the table is open for writing with the other control
 *   RG_E_ACCESS            no permission to open the file
 *   RG_E_TABLE_UNREADABLE, RG_E_BAD_REPLACES_OFFSET, RG_E_BAD_DELETED_ROW_OFFSET, RG_E_NO_COMMIT_RECORD
 *                          the file is damaged, or isn't a table
 *   RG_E_NO_MEMORY, RG_E_SYSTEM_CALL, RG_E_FILESYSTEM_FULL_DETAIL  the file could not be opened or read
 * A failure leaves everything as it was, except that a writer that joins readers and fails to read the file leaves its
 * open counted: the table then stays in the tree until the tree is closed.
 * Thread-safe; opens in a tree run one at a time. A forked child may open. See docs/ARCHITECTURE.md,
 * docs/BAD-INPUT.md. */
kt_int32_t rg_open_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                           rg_opaque_handle_t * p_result_table_handle);
/* The same, and if a file is read its rows are found by key through a hash table, as in rg_create_hashed_key_table_1. A
 * table that is in memory keeps what it has, and the arguments are checked and forgotten.
 *
 * Returns the codes above, and:
 *   RG_E_NULL_POINTER   total_hash_buckets is 0 or a function is NULL: ahead of everything else
 *   RG_E_DUPLICATE_KEY  two rows of the file have one key, though it is RG_PRIMARY_KEY; without an error record
 *   RG_E_INTERNAL       the hash function returned no bucket */
kt_int32_t rg_open_hashed_key_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                                      kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                      rg_hash_keys_compare_function_t * p_compare_function,
                                      rg_opaque_handle_t *              p_result_table_handle);
/* Gives a handle back. The last one on a table with a file takes the table out of memory; what is pending or applied is
 * dropped, and the file stays at its last commit. A transient table stays in its tree with its rows.
 *
 * A handle must not be used or closed again, nor be closed while another thread uses it: that isn't noticed.
 *
 * Returns 0; RG_E_INVALID_HANDLE if table_handle is NULL; RG_E_SYSTEM_CALL if the tree can't be locked, and then the
 * handle stays open. Thread-safe for handles of different tables. See docs/ARCHITECTURE.md. */
kt_int32_t rg_close_table_1(rg_opaque_handle_t table_handle);

/* ---- Transactions ---------------------------------------------------------------------------------------------- */

/* A transaction is all that was changed in a table since its last commit. Apply writes it to the table's file and syncs
 * it, without letting anybody see it there; commit lets it in; abort throws it away. On a table without explicit
 * control each update does all this before it returns, and these calls find nothing to do. A table without a file
 * passes the same states in memory. See docs/ARCHITECTURE.md for the road of an update, docs/RELIABILITY.md for what a
 * returned commit means. All three are thread-safe; they and the updates of a process run one at a time. */

/* Writes what is pending behind the table's live commit record, or, if the table is long and less than half of it is
 * live, the whole table into a rewrite file; then syncs. A reader of the file still sees the state before. Until
 * rg_commit_1 or rg_abort_1 the table takes no updates. With nothing pending the table still gets a new change counter.
 *
 *   table_change_counter  what the commit makes the table's change counter, even if it is lower; 0: one more than now.
 *                         A table without explicit control counts by itself and ignores it
 *
 * Returns 0 or, with the table's contents and what is pending as they were, so that it may be called again:
 *   RG_E_INVALID_HANDLE       table_handle is NULL
 *   RG_E_ACCESS               the table isn't open for writing, or there is no permission to make the rewrite file
 *   RG_E_APPLIED_UNCOMMITTED  it is applied already
 *   RG_E_NO_MEMORY            no memory
 *   RG_E_FILESYSTEM_FULL_DETAIL, RG_E_SYSTEM_CALL  the file could not be written; with "writev" and EFBIG it would
 *                             have passed the 4 GiB that a table can have
 *   RG_E_INTERNAL             in a forked child, without an error record */
kt_int32_t rg_apply_1(rg_opaque_handle_t table_handle, kt_uint64_t table_change_counter);

/* Makes what was applied the table's state, with one act that a crash can't split: a 4-byte overwrite, or a rename.
 * With nothing pending and nothing applied it does nothing.
 *
 * Returns 0 or, with the table still applied:
 *   RG_E_INVALID_HANDLE   table_handle is NULL
 *   RG_E_ACCESS           the table isn't open for writing, or there is no permission to rename its file
 *   RG_E_UNAPPLIED_TABLE  updates are pending that were not applied; nothing has changed
 *   RG_E_NO_MEMORY        no memory for a name, after a rewrite
 *   RG_E_FILESYSTEM_FULL_DETAIL, RG_E_SYSTEM_CALL  the file could not be written, renamed or synced
 *   RG_E_INTERNAL         in a forked child, without an error record
 * After a failure call rg_abort_1. A failed rewrite can only be aborted: its file is gone.
 *
 * One success isn't: if the overwrite could not be synced, and was taken back with success, the result is 0 and the
 * table is still applied, which the next update shows with RG_E_APPLIED_UNCOMMITTED. docs/RELIABILITY.md tells how to
 * notice, and what the file may hold then. */
kt_int32_t rg_commit_1(rg_opaque_handle_t table_handle);

/* Throws away what is pending or applied: the table is as its last commit left it. Legal at any time.
 *
 * Ahead of an apply this touches no file. Behind one that appended, the file is cut at the length that the table had in
 * memory when it was opened, and emptied in the process that created it: what was committed since may be cut off too.
 * So abort an applied table only if it was opened, and not committed since. docs/RELIABILITY.md tells the details.
 *
 * Returns 0 or:
 *   RG_E_INVALID_HANDLE  table_handle is NULL
 *   RG_E_ACCESS          the table isn't open for writing
 *   RG_E_INTERNAL        in a forked child, without an error record
 * What goes wrong with the file is not an error: it can leave nothing but dead bytes. */
kt_int32_t rg_abort_1(rg_opaque_handle_t table_handle);

/* ---- Adding rows ----------------------------------------------------------------------------------------------- */

/* Adds a row to the table's pending state; on an implicitly controlled table it is applied and committed as well.
 *
 *   p_column_names  total_values names, each once, the key column's among them; matched exactly
 *   p_p_fields      the values, in the order of the names. A NULL pointer inside a value of an indirect type stands for
 *                   the type's empty value. The row holds a copy: the values stay the caller's
 *
 * A column that isn't named takes its default, whatever its qualifier. On a table with a hash table, a key whose row's
 * deletion is pending revives that row: it keeps its fixed index.
 *
 * Returns 0, or with nothing changed:
 *   RG_E_INVALID_HANDLE       table_handle is NULL
 *   RG_E_ACCESS               the table isn't open for writing
 *   RG_E_APPLIED_UNCOMMITTED  updates are applied and not committed
 *   RG_E_NULL_POINTER         an array, a name or a value pointer is NULL
 *   RG_E_KEY_EXPECTED         the key column isn't named
 *   RG_E_NO_COLUMNS           a name that no column has, or one that stands twice
 *   RG_E_DUPLICATE_KEY        a row has the key already (RG_PRIMARY_KEY only; see docs/ODDITIES.md on reused slots)
 *   RG_E_LIBRARY_CALL         a value can't be stored: a string that the table's encoding lacks, or a broken record
 *   RG_E_NO_MEMORY            no memory for the record, the index or the change
 *   RG_E_INTERNAL             in a forked child, without an error record; or the hash function gave no bucket
 * and on an implicitly controlled table the codes of rg_apply_1, with the row taken back, and of rg_commit_1.
 * Thread-safe; the updates of a process run one at a time. See docs/ARCHITECTURE.md, docs/BAD-INPUT.md. */
kt_int32_t rg_add_row_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_fields,
                        kt_uint32_t total_values);

/* ---- Reading fields --------------------------------------------------------------------------------------------
 *
 * A row is addressed by its packed index (dense, 0 to the number of rows - 1; changes when rows go away), by its fixed
 * index (stays with the row while it lives) or by its key. The plain forms see the committed state. The visibility
 * forms see the applied state as well if uncommitted_updates_visible isn't 0, and deliver the row's state; so does
 * every form if the table was made with RG_UNCOMMITTED_UPDATES_VISIBLE in the environment.
 *
 *   column_name(s)  matched exactly; a column of any qualifier can be read
 *   result          where the value goes, or array_count pointers to where the values go. A scalar is copied; anything
 *                   else is one block that belongs to the caller, who releases it with free
 *   p_row_state     gets the row's state on success; may be NULL
 *
 * Each returns 0 or, with nothing changed but what is said below:
 *   RG_E_INVALID_HANDLE  table_handle is NULL
 *   RG_E_NULL_POINTER    a name or a result pointer is NULL; a NULL pointer as key
 *   RG_E_NO_SUCH_KEY     no row has the key. Keys are compared as they stand, without conversion of strings. The key of
 *                        an updated row is the committed one if the table has no hash table
 *   RG_E_NO_SUCH_INDEX   the packed index is not below the number of rows, or the fixed index not below the number of
 *                        slots; a negative index is taken as a large one
 *   RG_E_INVALID_COLUMN  no column has the name
 *   RG_E_ROW_DELETED     the row has no record in the state that is looked at, or no row is at the index. For one field
 *                        this comes after RG_E_INVALID_COLUMN, for several ahead of it
 *   RG_E_LIBRARY_CALL    a value can't be delivered: no memory, a string that the client's encoding can't hold, or
 *                        damaged bytes in the table
 *   RG_E_INTERNAL        the table's hash function returned no bucket
 * The forms for several fields deliver them one at a time: after a failure those ahead of it are delivered, and the
 * caller, who may have cleared the values first, frees them. With array_count 0 they only look at the row.
 * Thread-safe: any number of readers run together, in a forked child too. See docs/ARCHITECTURE.md. */

kt_int32_t rg_get_field_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t column_name,
                                   kt_value_t * result);
kt_int32_t rg_get_field_by_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t row_index,
                                                  kt_char_ptr_t column_name, kt_value_t * result,
                                                  kt_uint32_t      uncommitted_updates_visible,
                                                  rg_row_state_t * p_row_state);
kt_int32_t rg_get_field_by_fixed_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                                        kt_char_ptr_t column_name, kt_value_t * result,
                                                        kt_uint32_t      uncommitted_updates_visible,
                                                        rg_row_state_t * p_row_state);
kt_int32_t rg_get_field_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t column_name,
                                 kt_value_t * result);
kt_int32_t rg_get_field_by_key_and_visibility_1(rg_opaque_handle_t table_handle, kt_value_t row_key,
                                                kt_char_ptr_t column_name, kt_value_t * result,
                                                kt_uint32_t uncommitted_updates_visible, rg_row_state_t * p_row_state);
kt_int32_t rg_get_fields_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t * column_names,
                                    kt_value_t ** result, kt_uint32_t array_count);
kt_int32_t rg_get_fields_by_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t row_index,
                                                   kt_char_ptr_t * column_names, kt_value_t ** result,
                                                   kt_uint32_t array_count, kt_uint32_t uncommitted_updates_visible,
                                                   rg_row_state_t * p_row_state);
kt_int32_t rg_get_fields_by_fixed_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                                         kt_char_ptr_t * column_names, kt_value_t ** result,
                                                         kt_uint32_t      array_count,
                                                         kt_uint32_t      uncommitted_updates_visible,
                                                         rg_row_state_t * p_row_state);
kt_int32_t rg_get_fields_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t * column_names,
                                  kt_value_t ** result, kt_uint32_t array_count);
kt_int32_t rg_get_fields_by_key_and_visibility_1(rg_opaque_handle_t table_handle, kt_value_t row_key,
                                                 kt_char_ptr_t * column_names, kt_value_t ** result,
                                                 kt_uint32_t array_count, kt_uint32_t uncommitted_updates_visible,
                                                 rg_row_state_t * p_row_state);
/* Delivers the fixed index of the row with the key, which is found whatever its state: committed, added, or with its
 * deletion pending. With several rows of one key (RG_PRIMARY_KEY_NOCHECK) a hashed table gives the one added last, and
 * any other the one at the lowest packed index. Codes as above. */
kt_int32_t rg_get_fixed_row_index_for_key_1(rg_opaque_handle_t table_handle, kt_value_t key_value,
                                            kt_uint32_t * p_fixed_row_index);

/* ---- Setting fields --------------------------------------------------------------------------------------------
 *
 * Replaces fields of a row in the table's pending state; on an implicitly controlled table the update is applied and
 * committed as well. Rows are addressed as for reading, and an update always builds on the row's applied state.
 *
 *   column_name(s)  array_count names, each once; matched exactly
 *   new_field(s)    the values, in the order of the names (called `result` in rg_set_field_by_key_1, and only read
 *                   there). A NULL pointer inside a value of an indirect type stands for the type's empty value. The
 *                   row holds a copy: the values stay the caller's
 *
 * A column that isn't named keeps its value, or takes its default if it is RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED; so an
 * array_count of 0 is a change too. The key can be set like any other column: there is no test for a duplicate, and on
 * a hashed table the row stays in the bucket of its old key.
 *
 * Each returns 0 or, with nothing changed:
 *   RG_E_INVALID_HANDLE       table_handle is NULL
 *   RG_E_ACCESS               the table isn't open for writing
 *   RG_E_NO_SUCH_KEY          no row has the key
 *   RG_E_APPLIED_UNCOMMITTED  updates are applied and not committed
 *   RG_E_NULL_POINTER         an array, a name or a value pointer is NULL; a NULL pointer as key
 *   RG_E_NO_SUCH_INDEX        as for reading
 *   RG_E_ROW_DELETED          the row has no applied record: its deletion is pending, or no row is at the index
 *   RG_E_INVALID_COLUMN       a name of an RG_PROTECTED column, one that no column has, or one that stands twice
 *   RG_E_LIBRARY_CALL         a value can't be stored: a string that the table's encoding lacks, or a broken record
 *   RG_E_TABLE_UNREADABLE     a value that would be kept leads outside the row: the table's file is damaged
 *   RG_E_NO_MEMORY            no memory for the record or the change
 *   RG_E_INTERNAL             in a forked child, without an error record; or the hash function gave no bucket
 * and on an implicitly controlled table the codes of rg_apply_1, with the update taken back, and of rg_commit_1.
 * Thread-safe; the updates of a process run one at a time. See docs/ARCHITECTURE.md, docs/BAD-INPUT.md. */

kt_int32_t rg_set_field_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t column_name,
                                   kt_value_t * new_field);
kt_int32_t rg_set_field_by_fixed_index_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                         kt_char_ptr_t column_name, kt_value_t * new_field);
kt_int32_t rg_set_field_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t column_name,
                                 kt_value_t * result);
kt_int32_t rg_set_fields_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t * column_names,
                                    kt_value_t ** new_fields, kt_uint32_t array_count);
kt_int32_t rg_set_fields_by_fixed_index_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                          kt_char_ptr_t * column_names, kt_value_t ** new_fields,
                                          kt_uint32_t array_count);
kt_int32_t rg_set_fields_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t * column_names,
                                  kt_value_t ** new_values, kt_uint32_t array_count);

/* ---- Deleting rows --------------------------------------------------------------------------------------------- */

/* Deletes the row at a packed index in the table's pending state; on an implicitly controlled table the deletion is
 * applied and committed as well. The row's indices stay until commit, so that rows can be deleted one after the other
 * in one transaction without their positions shifting.
 *
 * Returns 0 or, with nothing changed:
 *   RG_E_INVALID_HANDLE  table_handle is NULL
 *   RG_E_ACCESS          the table isn't open for writing
 *   RG_E_NO_SUCH_INDEX   row_index is not below the number of rows
 *   RG_E_ROW_DELETED     the row's deletion is pending already
 *   RG_E_NO_MEMORY       no memory for the change
 *   RG_E_INTERNAL        in a forked child, without an error record
 * and on an implicitly controlled table the codes of rg_apply_1, with the deletion taken back, and of rg_commit_1.
 * Between apply and commit the call goes through, unlike any other update: the deletion then takes part in the commit
 * in memory without being in the file. Thread-safe; the updates of a process run one at a time. See
 * docs/ARCHITECTURE.md. */
kt_int32_t rg_delete_row_by_index_1(rg_opaque_handle_t table_handle, kt_uint32_t row_index);

/* Deletes the rows that match criteria, judged by their applied state, in the table's pending state; on an implicitly
 * controlled table the deletions are applied and committed as well.
 *
 *   selection_criteria  an expression with "$" variables, see docs/SELECTION.md; NULL: all rows, no arguments are taken
 *   ...                 the values of the variables, in order
 *
 * Criteria that no row matches are a success. A row whose evaluation faults, as in a division by zero, doesn't match.
 *
 * Returns 0 or:
 *   RG_E_INVALID_HANDLE         table_handle is NULL
 *   RG_E_ACCESS                 the table isn't open for writing
 *   RG_E_INVALID_VARIABLE_TYPE  a wrong "$" variable
 *   RG_E_NULL_POINTER           a NULL pointer as the value of a $S, $B or $RH variable
 *   RG_E_APPLIED_UNCOMMITTED    updates are applied and not committed
 *   RG_E_NO_ROWS_TO_DELETE      the table has no rows, or all are deleted already
 *   RG_E_LIBRARY_CALL           the criteria can't be compiled (ku_expr_diagnosis_1 says why) or converted
 *   RG_E_NO_MEMORY              no memory for a change, after which the rows deleted so far stay deleted, or for the
 *                               criteria
 *   RG_E_INTERNAL               in a forked child, without an error record
 * with nothing changed but where it says so; and on an implicitly controlled table the codes of rg_apply_1, with the
 * deletions taken back, and of rg_commit_1. Thread-safe; the updates of a process run one at a time. */
kt_int32_t rg_delete_rows_1(rg_opaque_handle_t table_handle, kt_char_ptr_t selection_criteria, ...);

/* ---- Finding rows ----------------------------------------------------------------------------------------------
 *
 * Criteria are an expression with "$" variables whose values follow as arguments: see docs/SELECTION.md. Never put a
 * foreign string into criteria by hand, nor through $S if it may hold a quote: nothing in it is escaped. */

/* Makes a table in memory of the rows that match criteria. It has no name and is the caller's to close. It stays in the
 * source's tree and shares nothing else with it.
 *
 *   column_names      array_count names of the columns that it has behind the key, which is always its first; not
 *                     looked at if array_count is 0, which stands for all columns in the source's order
 *   result            receives its handle
 *   selection_string  NULL: all rows
 *
 * Committed rows are selected, or the applied ones if the source was made with RG_UNCOMMITTED_UPDATES_VISIBLE in the
 * environment. They stand from fixed index 0 on in the order of the source's fixed indices. The result is hashed if the
 * source is.
 *
 * Returns 0 or, with nothing made:
 *   RG_E_INVALID_HANDLE         table_handle is NULL
 *   RG_E_NULL_POINTER           result, a column name, or the value of a $S, $B or $RH variable is NULL
 *   RG_E_INVALID_VARIABLE_TYPE  a wrong "$" variable
 *   RG_E_NO_COLUMNS             column_names is NULL and array_count isn't 0
 *   RG_E_INVALID_COLUMN         no column has one of the names
 *   RG_E_LIBRARY_CALL           the criteria can't be compiled (ku_expr_diagnosis_1 says why) or converted
 *   RG_E_DUPLICATE_KEY          without an error record: two rows of a hashed source have one key, which setting the
 *                               key field can lead to
 *   RG_E_TABLE_UNREADABLE       a value of a chosen column leads outside its row: the table's file is damaged
 *   RG_E_NO_MEMORY              no memory for the result
 * Thread-safe; other changes of the tree wait meanwhile. */
kt_int32_t rg_select_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * column_names, kt_uint32_t array_count,
                       rg_opaque_handle_t * result, kt_char_ptr_t selection_string, ...);

/* Lists the fixed indices of the rows that match criteria, in ascending order.
 *
 *   p_selection_criteria           NULL: all rows
 *   ap                             the values of the variables
 *   uncommitted_updates_visible    not 0: the rows of the applied state are looked at, else those of the committed one,
 *                                  unless the table was made with RG_UNCOMMITTED_UPDATES_VISIBLE in the environment
 *   p_total_selected_rows          receives how many
 *   p_p_selected_rows_fixed_index  receives the list, which the caller frees, also if it is empty
 *
 * Whichever rows are looked at, each is judged by its applied values; a row whose deletion is pending matches no
 * criteria.
 *
 * Returns 0, RG_E_INVALID_HANDLE, RG_E_NULL_POINTER, RG_E_INVALID_VARIABLE_TYPE, RG_E_LIBRARY_CALL or RG_E_NO_MEMORY,
 * as above, with nothing delivered. Thread-safe. */
kt_int32_t rg_get_selected_rows_v_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_selection_criteria, va_list ap,
                                    kt_uint32_t uncommitted_updates_visible, kt_uint32_t * p_total_selected_rows,
                                    kt_uint32_t ** p_p_selected_rows_fixed_index);

/* Lists the fixed indices of the rows with pending changes: those added or set, in the order of their first change, and
 * behind them those deleted.
 *
 *   p_updated_rows_count            receives how many were added or set: the deleted rows behind them aren't counted
 *   p_p_updated_rows_fixed_indices  receives the list, which the caller frees; NULL if nothing is pending
 *
 * Returns 0, RG_E_INVALID_HANDLE, RG_E_NULL_POINTER or RG_E_NO_MEMORY, with nothing delivered. Thread-safe. */
kt_int32_t rg_get_updated_rows_1(rg_opaque_handle_t table_handle, kt_uint32_t * p_updated_rows_count,
                                 kt_uint32_t ** p_p_updated_rows_fixed_indices);

/* Lists the fixed indices of the rows that have a key: on a hashed table the row added last comes first, on any other
 * they ascend. The key is compared as it stands, without conversion of strings.
 *
 *   p_duplicate_rows_count            receives how many
 *   p_p_duplicate_rows_fixed_indices  receives the list, which the caller frees
 *   uncommitted_updates_visible       not 0: rows of the applied state, else of the committed one; nothing else counts
 *
 * Returns 0, RG_E_INVALID_HANDLE, RG_E_NULL_POINTER (also for a NULL pointer as key), RG_E_NO_SUCH_KEY, RG_E_INTERNAL
 * if the hash function gave no bucket, or RG_E_NO_MEMORY, with nothing delivered. Thread-safe. */
kt_int32_t rg_get_duplicate_rows_1(rg_opaque_handle_t table_handle, kt_value_t key_value,
                                   kt_uint32_t *  p_duplicate_rows_count,
                                   kt_uint32_t ** p_p_duplicate_rows_fixed_indices,
                                   kt_uint32_t    uncommitted_updates_visible);

/* ---- The application's own data -------------------------------------------------------------------------------- */

/* A table carries one binary of the application's beside its rows. It is applied, committed and aborted with them, and
 * stands in the file's commit record, so that it changes atomically with the rows. */

/* Gives the table a new version of the binary: pending, or on an implicitly controlled table applied and committed.
 *
 *   p_binary  copied; a length of 0 is a binary too
 *
 * Returns 0 or, with nothing changed:
 *   RG_E_INVALID_HANDLE  table_handle is NULL
 *   RG_E_NULL_POINTER    p_binary is NULL
 *   RG_E_ACCESS          the table isn't open for writing
 *   RG_E_NO_MEMORY       no memory for the copy
 *   RG_E_INTERNAL        in a forked child, without an error record
 * and on an implicitly controlled table the codes of rg_apply_1, with the binary taken back, and of rg_commit_1. With
 * explicit control the call goes through while an apply is outstanding: the commit then takes a binary that isn't in
 * the file. Thread-safe; the updates of a process run one at a time. See docs/ARCHITECTURE.md, docs/BAD-INPUT.md. */
kt_int32_t rg_set_application_metadata_1(rg_opaque_handle_t table_handle, kt_binary_t * p_binary);
/* Delivers a copy of the committed binary, or of the pending one if the table was made with
 * RG_UNCOMMITTED_UPDATES_VISIBLE in the environment.
 *
 *   p_p_binary  gets a block that belongs to the caller, who releases it with free
 *
 * Returns 0 or, with *p_p_binary as it was:
 *   RG_E_INVALID_HANDLE  table_handle is NULL
 *   RG_E_NULL_POINTER    p_p_binary is NULL
 *   RG_E_NO_SUCH_KEY     the table has no binary, or none that is committed
 *   RG_E_ROW_DELETED     the binary's deletion is pending and visible; no call of this interface makes one
 *   RG_E_NO_MEMORY       no memory for the copy
 * Thread-safe: any number of readers run together, in a forked child too. See docs/ARCHITECTURE.md. */
kt_int32_t rg_get_application_metadata_1(rg_opaque_handle_t table_handle, kt_binary_t ** p_p_binary);

/* ---- Whole tables ---------------------------------------------------------------------------------------------- */

/* Deletes a table: takes it out of the tree, and a table with a file off the disk, with its rewrite file if there is
 * one. A table that is open lives on outside the tree until its handles are closed: they go on working, in memory and
 * on the removed file, and a new table of that name has nothing to do with it. The same holds for other processes that
 * have the table open: no file lock is taken.
 *
 *   p_registry_path  1 to 255 letters, digits, '_' and '/'
 *
 * Returns 0 or:
 *   RG_E_INVALID_HANDLE  tree_handle is NULL
 *   RG_E_INVALID_PATH    the path can't be one
 *   RG_E_NO_SUCH_TABLE   no such table in the tree, or no file at a path under a mount point
 *   RG_E_ACCESS, RG_E_SYSTEM_CALL ("unlink")  the file can't be removed. The table has left the tree all the same, and
 *                        can be opened anew from its file
 *   RG_E_NO_MEMORY       no memory for the file's path; nothing changed
 *   RG_E_SYSTEM_CALL     the tree's lock fails; nothing changed
 *   RG_E_INTERNAL        in a forked child, without an error record
 * Thread-safe; the updates of a process run one at a time. See docs/ARCHITECTURE.md, docs/BAD-INPUT.md. */
kt_int32_t rg_delete_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path);

/* Copies a table to another registry path: whole, with its columns, rows and the application's data. Where source and
 * target lie decides how:
 *
 *   - A table that is in the tree's memory, open or not, is copied from there, also if it has a file. A path under a
 *     mount point that no table of the tree stands for is copied from its file.
 *   - To a path under a mount point, a copy from memory writes what a rewrite of the table would: pending updates go
 *     along, but the change counter is the committed one. A copy from a file copies its bytes. The new file is prepared
 *     beside the target, synced, and renamed, so that a reader finds the old target or the new one. Where the target is
 *     open in the tree, its handles show the new contents afterwards.
 *   - To another path the copy lives in memory, with the row indices of its source. It stays good whatever becomes of
 *     the source. A table with anything pending or applied can't be copied so.
 *
 * A copy to a file waits until no other process copies into the directory or has the target open for writing, with the
 * tree locked.
 *
 *   table_handle         the source; or tree_handle and p_source_table_name, its path
 *   p_target_table_name  the target's path
 *   overwrite            not 0: the target may exist. In memory its handles dangle from then on. A target file of no
 *                        length counts as none
 *
 * Returns 0 or, with source and target as they were:
 *   RG_E_INVALID_HANDLE     the handle is NULL
 *   RG_E_INVALID_PATH       a path can't be one
 *   RG_E_NO_SUCH_TABLE      no such source. An empty target file may have been made
 *   RG_E_TABLE_EXISTS       the target exists and overwrite is 0; or source and target are one and the same table, in
 *                           memory or for a move. A table with a file may be copied onto itself, with overwrite
 *   RG_E_UNCOMMITTED_TABLE  copying in memory, with updates pending or applied
 *   RG_E_DUPLICATE_KEY      copying in memory, with two rows of one key that were set so; without an error record
 *   RG_E_ACCESS             no permission for a file
 *   RG_E_FILESYSTEM_FULL_DETAIL, RG_E_SYSTEM_CALL  a file can't be opened, locked, read, written or renamed: "lockf" if
 *                           the target is open for reading only in this tree, "rename" if a file would be moved to
 *                           another file system, "writev" if the file would pass 4 GiB
 *   RG_E_TABLE_UNREADABLE, RG_E_BAD_REPLACES_OFFSET, RG_E_BAD_DELETED_ROW_OFFSET, RG_E_NO_COMMIT_RECORD
 *                           a file that is copied into memory is damaged
 *   RG_E_NO_MEMORY          no memory
 *   RG_E_INTERNAL           in a forked child, without an error record
 * Where the target is open with a hash table, a failure of the copy itself, RG_E_TABLE_EXISTS among them, is forgotten:
 * the call returns 0 and the target is read afresh from its unchanged file. Thread-safe; the updates of a process run
 * one at a time. See docs/ARCHITECTURE.md, docs/FILE-FORMAT.md, docs/BAD-INPUT.md. */
kt_int32_t rg_copy_table_by_handle_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_target_table_name,
                                     kt_int32_t overwrite);
kt_int32_t rg_copy_table_by_name_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_source_table_name,
                                   kt_char_ptr_t p_target_table_name, kt_int32_t overwrite);
/* Moves a table to another registry path. To a path under a mount point a table in memory is copied as above and then
 * removed, and a file is renamed; to another path the table object itself takes the new name, pending updates and all,
 * and a file is read into memory and then removed. A table in memory that has a file loses it, and goes on with the file
 * that it has open.
 *
 * A source that can't be removed doesn't fail a move. Handles on a source that was written to a file stay good, on a
 * table outside the tree. Arguments and codes are those of the copies; what is pending doesn't keep a table from being
 * moved in memory. */
kt_int32_t rg_move_table_by_handle_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_target_table_name,
                                     kt_int32_t overwrite);
kt_int32_t rg_move_table_by_name_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_source_table_name,
                                   kt_char_ptr_t p_target_table_name, kt_int32_t overwrite);

/* Removes the stray rewrite files that a crash can leave beside tables with files. No table is looked into, and none
 * needs to exist. A rewrite that is under way, in any process, loses its file by this and fails when it would be
 * renamed: call it when nobody writes.
 *
 *   p_table_names  array_count registry paths, handled in order; those under no mount point are passed over
 *   array_count    0 is a success, whatever p_table_names is
 *
 * Returns 0, also where there is no such file or it can't be removed, or:
 *   RG_E_INVALID_HANDLE  tree_handle is NULL
 *   RG_E_NULL_POINTER    p_table_names is NULL
 *   RG_E_INVALID_PATH    a name can't be a path: those ahead of it are done, and those behind aren't looked at
 *   RG_E_NO_MEMORY       no memory for a path; likewise
 *   RG_E_SYSTEM_CALL     the tree's lock fails
 * Thread-safe. Also in a forked child. See docs/ARCHITECTURE.md. */
kt_int32_t rg_repair_tables_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t * p_table_names, kt_uint32_t array_count);

/* ---- Packed tables ---------------------------------------------------------------------------------------------
 *
 * One contiguous buffer with any number of tables: names, columns and rows. It may be sent to another process by
 * whatever means, also to a machine of another byte order. There it is converted in place, if need be, and each of its
 * tables can be made a read-only table of a tree. docs/PACKED-FORMAT.md tells the buffer byte by byte. */

/* Packs tables into one buffer.
 *
 *   total_tables                   how many; 0 gives a buffer without tables, and the arrays aren't looked at
 *   p_table_handles                the tables, in the order that the buffer will have. One may stand there twice. They
 *                                  must stay open until the call returns
 *   p_uncommitted_updates_visible  for each table, non-zero: pack it with its uncommitted updates; 0: as committed.
 *                                  What the table's readers see plays no part
 *   p_total_row_fixed_indices      for each table, how many rows are chosen; 0: all of its rows, in the order of their
 *                                  fixed indices. So no table can be packed without rows while it has some
 *   p_row_fixed_indices            the fixed indices of the chosen rows, the runs of the tables one behind the other;
 *                                  in any order, and repeated at will. NULL if no table has any
 *   p_p_buffer                     receives the buffer, which the caller releases with free. Its first word is its
 *                                  length
 *
 * Returns 0 or, with *p_p_buffer as it was:
 *   RG_E_NULL_POINTER    an array or p_p_buffer is NULL
 *   RG_E_INVALID_HANDLE  a handle is NULL
 *   RG_E_ROW_DELETED     a chosen row isn't there in the role asked for: no row has that index, its deletion is
 *                        pending, or it isn't committed yet
 *   RG_E_NO_MEMORY       no memory
 *   RG_E_LIBRARY_CALL    a default value is damaged, or the buffer would exceed 4 GiB - 1
 *   RG_E_INTERNAL        a definition of structured data has field names so short that its packed form can't be walked
 *   RG_E_SYSTEM_CALL     a lock fails
 * Thread-safe; also in a forked child. All tables are read-locked together, so the buffer holds one moment. A default
 * of structured data doesn't travel, nor does the application's own binary. See docs/PACKED-FORMAT.md,
 * docs/BAD-INPUT.md. */
kt_int32_t rg_pack_tables_1(kt_uint32_t total_tables, rg_opaque_handle_t * p_table_handles,
                            kt_uint32_t * p_uncommitted_updates_visible, kt_uint32_t * p_total_row_fixed_indices,
                            kt_uint32_t * p_row_fixed_indices, void ** p_p_buffer);

/* Converts a buffer in place to this machine's byte order. That comes before anything else is done with a buffer that
 * may come from another machine; on a buffer of this machine's order it changes nothing.
 *
 *   p_buffer                  the buffer, at any address, as long as its header tells
 *   header_already_converted  non-zero: the caller has put kt_pmsg_length into local order, having had to read it, and
 *                             do_conversion is the verdict. 0: the header is as it was received, and tells the verdict
 *   do_conversion             non-zero: the rest has to be converted. Not looked at otherwise
 *
 * Returns 0 or:
 *   RG_E_NULL_POINTER  p_buffer is NULL
 *   RG_E_LIBRARY_CALL  the header is none ("kt_pmsg_cnv_required"), or the buffer is damaged: an anchor, a count or a
 *                      length leaves what it lies in, items overlap, or a type is none. Also if no memory is left for
 *                      a look at the metadata. The error record has the value library's code
 * A conversion that fails has changed part of the buffer, which is good for nothing then. A second conversion by the
 * header's word does nothing. A buffer in which a row was chosen so often that it holds more rows than the table had is
 * converted up to that number of rows only. Takes no lock: the buffer belongs to the caller. See
 * docs/PACKED-FORMAT.md, docs/BAD-INPUT.md. */
kt_int32_t rg_convert_packed_table_buffer_1(void * p_buffer, kt_uint32_t header_already_converted,
                                            kt_int32_t do_conversion);

/* Tells how many tables a buffer holds.
 *
 *   p_buffer               a buffer in local order; looked at up to the length in its header
 *   p_total_packed_tables  receives the number; untouched after a failure
 *
 * Returns 0; RG_E_NULL_POINTER if an argument is NULL; RG_E_LIBRARY_CALL if the buffer is too short for what it tells.
 * Takes no lock: the buffer belongs to the caller. See docs/PACKED-FORMAT.md. */
kt_int32_t rg_get_total_packed_tables_1(void * p_buffer, kt_uint32_t * p_total_packed_tables);

/* Tells a table's name on the sender: its registry path, or the path of its file if it had one. That isn't the name
 * that unpacking gives it, which is always the registry path.
 *
 *   p_buffer      as above
 *   table_index   from 0
 *   p_table_name  receives a pointer into the buffer, good as long as that is; untouched after a failure
 *
 * Returns 0; RG_E_NULL_POINTER; RG_E_LIBRARY_CALL if the buffer is too short for what it tells, or the name leaves it;
 * RG_E_NO_SUCH_INDEX. Index 0xFFFFFFFF is no wrong index but leads to the words ahead of the tables, and mostly to the
 * first name. Takes no lock. See docs/PACKED-FORMAT.md, docs/BAD-INPUT.md. */
kt_int32_t rg_get_packed_table_name_1(void * p_buffer, kt_uint32_t table_index, kt_char_ptr_t * p_table_name);

/* Makes one table of a buffer a table of a tree, under its registry path on the sender. The table is transient and
 * read-only: every call that needs a table open for writing is refused with RG_E_ACCESS, opening it for writing too.
 * All its rows are committed. The sender's change counter and the application's own binary don't travel.
 *
 *   p_buffer            a buffer in local order; looked at up to the length in its header. The table keeps nothing of
 *                       it: the buffer may go when the call returns
 *   total_hash_buckets  0: no hash table, but for a table keyed by resource handle, which always gets one; without one
 *                       the check of an RG_PRIMARY_KEY makes the call take time in proportion to the square of the rows
 *   hash_function       of the key's stored form, as for rg_create_hashed_key_table_1; not looked at without buckets.
 *                       NULL: the built-in rule, for a key that is a resource handle
 *   compare_function    likewise
 *   tree_handle         the tree; its write lock is held while the table is made
 *   table_index         from 0
 *   p_table             receives the handle, for rg_close_table_1; untouched after a failure
 *
 * Returns 0 or, with nothing made:
 *   RG_E_NULL_POINTER    p_buffer or p_table is NULL, or a function is missing for hashing the key
 *   RG_E_NO_SUCH_INDEX   the buffer has no such table
 *   RG_E_LIBRARY_CALL    the buffer is damaged, or holds something else at the place of a table's parts, or no memory
 *                        is left for a part. The error record has the value library's code
 *   RG_E_INVALID_HANDLE  tree_handle is NULL
 *   RG_E_INVALID_PATH    the table's path is none; a table without a name has the empty path
 *   RG_E_TABLE_EXISTS    the tree has a table of that name
 *   RG_E_INTERNAL        the path lies under a mount point, without an error record; or the hash function gave no
 *                        bucket
 *   RG_E_NO_COLUMNS, RG_E_INVALID_COLUMN, RG_E_DUPLICATE_COLUMN, RG_E_KEY_EXPECTED
 *                        the columns are refused as by rg_create_table_1
 *   RG_E_DUPLICATE_KEY   two rows have one key, or there is more than one key column
 *   RG_E_NO_MEMORY       no memory
 *   RG_E_SYSTEM_CALL     the tree's lock fails
 * Thread-safe; also in a forked child. A value inside a row is only looked at when it is read, and then a damaged one
 * gives RG_E_LIBRARY_CALL. See docs/PACKED-FORMAT.md, docs/BAD-INPUT.md. */
kt_int32_t rg_unpack_table_1(void * p_buffer, kt_uint32_t total_hash_buckets, rg_hash_function_t * hash_function,
                             rg_hash_keys_compare_function_t * compare_function, rg_opaque_handle_t tree_handle,
                             kt_uint32_t table_index, rg_opaque_handle_t * p_table);

/* ---- Telling what there is ------------------------------------------------------------------------------------- */

/* Lists the tables under a path. Under a mount point these are the files of its directory, also those that nobody has
 * opened; elsewhere the tree's transient tables, also those that nobody has open. The path is a plain prefix of the
 * tables' names, and the order is none.
 *
 *   tree_handle      the tree
 *   p_registry_path  a registry path; a mount point may be given with or without its trailing "/"
 *   p_table_list     receives an array of registry paths, never NULL, to be given back through rg_free_table_list_1;
 *                    untouched after a failure
 *   array_count      receives the number of tables, maybe 0; untouched after a failure
 *
 * Returns 0; RG_E_INVALID_HANDLE; RG_E_INVALID_PATH, also for a NULL path; RG_E_NULL_POINTER if a result pointer is
 * NULL; RG_E_ACCESS if the directory may not be read; RG_E_SYSTEM_CALL if it can't be, or the tree's lock fails;
 * RG_E_NO_MEMORY. Thread-safe; holds the tree's write lock while it lists, directory reading included. */
kt_int32_t rg_list_tables_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                            kt_char_ptr_t ** p_table_list, kt_uint32_t * array_count);

/* Gives back a list of rg_list_tables_1 with its strings.
 *
 *   p_table_list  the list; entries that are NULL are passed over
 *   array_count   the count that came with it
 *
 * Returns 0; RG_E_NULL_POINTER for a NULL list. Takes no lock. */
kt_int32_t rg_free_table_list_1(kt_char_ptr_t * p_table_list, kt_uint32_t array_count);

/* What a table tells about itself. Nothing in it points into the table: it outlives the table's handle. */
typedef struct rg_table_metadata_t {
    kt_char_ptr_t name;                 /* registry path, or the name in memory; "" for a selection result */
    kt_uint32_t   number_of_rows;       /* committed, or applied if the table shows those; pending deletions count */
    kt_uint32_t   number_of_columns;    /* of the table, or of column_definitions if they were asked for */
    kt_uint64_t   table_change_counter; /* of the committed state */
    kt_int32_t    properties;           /* 0 */
    rg_column_t * column_definitions;   /* NULL, or number_of_columns definitions in client form */
} rg_table_metadata_t;

KT_STATIC_ASSERT(sizeof(rg_table_metadata_t) == 40 && offsetof(rg_table_metadata_t, table_change_counter) == 16 &&
                     offsetof(rg_table_metadata_t, column_definitions) == 32,
                 "rg_table_metadata_t");

/* Describes an open table.
 *
 *   table_handle   the table
 *   all_metadata   0: no column definitions; -1: those of all columns; anything else: those of the columns that aren't
 *                  RG_INVISIBLE
 *   p_p_metadata   receives the description, to be given back through rg_free_table_metadata_1; untouched after a
 *                  failure
 *
 * Returns 0; RG_E_INVALID_HANDLE; RG_E_NULL_POINTER for a NULL p_p_metadata; RG_E_NO_MEMORY; RG_E_LIBRARY_CALL if a
 * default value can't be made; RG_E_SYSTEM_CALL if the table's lock fails. After a failure behind the handle and the
 * lock the error record doesn't tell it: docs/ODDITIES.md. Thread-safe; takes the table's read lock. */
kt_int32_t rg_get_table_metadata_1(rg_opaque_handle_t table_handle, kt_int32_t all_metadata,
                                   rg_table_metadata_t ** p_p_metadata);

/* Gives back a description with all that it owns. Returns 0; RG_E_NULL_POINTER for NULL. Takes no lock. */
kt_int32_t rg_free_table_metadata_1(rg_table_metadata_t * p_metadata);

/* ---- Changing columns ------------------------------------------------------------------------------------------
 *
 * A table is never edited in place: each change builds a second table in memory with the new columns and all rows,
 * rewrites the file from it if there is one, and then the handles show its contents. So a change costs a copy of every
 * row, with the table locked and the updates of the process waiting, and for a table with a file a rewrite with its
 * sync. It stands on its own, whatever control the table has: it needs a table with nothing pending or applied, and when
 * it returns it is committed and counts in the change counter.
 *
 * What a caller must know:
 *   - Rows get new fixed indices: 0, 1, 2 and so on. Packed indices are right only where the table never lost a row,
 *     and so is finding keys without a hash table, which goes by them: close and open the table, or go by fixed indices.
 *   - **Of a table with a file, close all handles after a change and open it again before the next update.** The object
 *     still has the place of the old file's live commit record, and an update that appends writes there, in the middle
 *     of the new file, which spoils it. Further column changes are safe, since they rewrite.
 *   - The application's data isn't in the rewritten file until another commit writes it: a reopen before doesn't find it.
 *   - Of a transient table, adding, renaming and changing a default leave all rows uncommitted, though nothing is
 *     pending: only reads that ask for uncommitted updates see them, and setting a field of a row and committing brings
 *     it back. Another such change gives RG_E_ROW_DELETED, and a deletion of columns loses these rows. Deleting columns
 *     of a table whose rows are committed has no such effect.
 *
 * All calls here return 0 or one of these; a failure leaves the table and its file as they were:
 *   RG_E_INVALID_HANDLE     table_handle is NULL
 *   RG_E_ACCESS             the table isn't open for writing; or the rewrite file may not be written
 *   RG_E_UNCOMMITTED_TABLE  a row is changed and not committed, or the table is applied
 *   RG_E_ROW_DELETED        there are rows that no commit has, as told above
 *   RG_E_DUPLICATE_KEY      two rows have one key, though it is RG_PRIMARY_KEY: a set field may have made them
 *   RG_E_LIBRARY_CALL       a value or a default is damaged, or can't be converted
 *   RG_E_NO_MEMORY          no memory
 *   RG_E_SYSTEM_CALL, RG_E_FILESYSTEM_FULL_DETAIL  the table's lock fails, or the file can't be rewritten
 *   RG_E_INTERNAL           in a forked child, without an error record
 * A failure in building the new table, other than that of a deletion, is told by its code alone: the error record is
 * cleared (docs/ODDITIES.md).
 * Thread-safe; the updates of a process run one at a time. See docs/ARCHITECTURE.md, docs/BAD-INPUT.md. */

/* Adds columns behind those that there are. Rows that exist take the columns' defaults.
 *
 *   table_handle  the table
 *   columns       array_count columns, as for rg_create_table_1, none with a key qualifier. The library copies what it
 *                 keeps, and leaves the array alone
 *   array_count   0 rewrites the table as it is, and counts as a change
 *
 * Returns one of the codes above, or:
 *   RG_E_NULL_POINTER      columns is NULL
 *   RG_E_INVALID_COLUMN    a column that no table can have
 *   RG_E_DUPLICATE_KEY     a column with a key qualifier
 *   RG_E_DUPLICATE_COLUMN  the name of another column */
kt_int32_t rg_add_columns_1(rg_opaque_handle_t table_handle, rg_column_t * columns, kt_uint32_t array_count);
/* Deletes columns with their values. The others keep their order.
 *
 *   column_names  array_count names, each of a column that is neither the key nor RG_INVISIBLE, each once
 *
 * Returns one of the codes above, or:
 *   RG_E_NULL_POINTER    column_names or one of them is NULL
 *   RG_E_NO_COLUMNS      array_count is 0
 *   RG_E_INVALID_COLUMN  there is no such column, or it can't be deleted, or it stands twice */
kt_int32_t rg_delete_columns_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * column_names, kt_uint32_t array_count);
/* Renames a column. Only for tables without an RG_INVISIBLE column.
 *
 *   column_name  the column; NULL rewrites the table as it is
 *   new_name     may be the name that it has
 *
 * Returns one of the codes above, or:
 *   RG_E_NULL_POINTER      new_name is NULL
 *   RG_E_INVALID_COLUMN    no such column, a new name that no column can have, or a table with an invisible column
 *   RG_E_DUPLICATE_COLUMN  another column has the name */
kt_int32_t rg_change_column_name_1(rg_opaque_handle_t table_handle, kt_char_ptr_t column_name, kt_char_ptr_t new_name);
/* Gives a column another default. Rows that exist keep their values, also those that came from the old default. Only
 * for tables without an RG_INVISIBLE column.
 *
 *   column_name  the column; NULL rewrites the table as it is
 *   new_value    by the column's type; copied. A NULL pointer stands for the type's empty value
 *
 * Returns one of the codes above, or RG_E_INVALID_COLUMN: no such column, or a table with an invisible column. */
kt_int32_t rg_change_default_value_1(rg_opaque_handle_t table_handle, kt_char_ptr_t column_name, kt_value_t new_value);

/* Gives a column another default at once and in memory, without a rewrite: for rows added from now on, and for whoever
 * asks for the table's description. It is no pending update: no commit is needed and no abort undoes it, the change
 * counter stays, and it works on tables that are open for reading. It ends with the table object, unless the table is
 * rewritten or copied to a file before: that takes the definitions from memory.
 *
 *   p_column_name      any column, invisible ones and the key included
 *   new_default_value  by the column's type; copied. A NULL pointer stands for the type's empty value. A value of a
 *                      variable-length type may not be longer than the default that it replaces, and a shorter one
 *                      gives the difference up for good
 *
 * Returns 0 or, with the column unchanged:
 *   RG_E_INVALID_HANDLE     table_handle is NULL
 *   RG_E_NULL_POINTER       p_column_name is NULL
 *   RG_E_INVALID_COLUMN     no such column
 *   RG_E_NO_ROWS_TO_DELETE  the value is too long; the message doesn't tell that (docs/ODDITIES.md)
 *   RG_E_LIBRARY_CALL       the value can't be stored
 *   RG_E_TABLE_UNREADABLE   the file that the table was read from is damaged: the default's place belongs to something
 *                           else too
 *   RG_E_NO_MEMORY          no memory
 *   RG_E_SYSTEM_CALL        the table's lock fails
 *   RG_E_INTERNAL           in a forked child, without an error record
 * Thread-safe; readers see the old default or the new one, whole. See docs/BAD-INPUT.md. */
kt_int32_t rg_overlay_memory_default_value_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_column_name,
                                             kt_value_t new_default_value);
/* Gives a standard column other flags, in the same way: RG_PROTECTED, RG_INVISIBLE, RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED.
 *
 *   new_qualifier  RG_STANDARD with flags. It is stored as it is
 *
 * Returns 0 or, with the column unchanged: RG_E_INVALID_COLUMN if there is no such column, or its kind or the new one
 * isn't RG_STANDARD; RG_E_INVALID_HANDLE, RG_E_NULL_POINTER, RG_E_SYSTEM_CALL and RG_E_INTERNAL as above. */
kt_int32_t rg_overlay_memory_column_qualifier_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_column_name,
                                                rg_qualifier_t new_qualifier);

/* The list of tables in the shape of an older directory interface. A registry has no directories. */
typedef kt_uint32_t rg_entry_t;
enum { RG_TABLE = 1 };
typedef kt_uint32_t rg_storage_t;
enum { RG_UNKNOWN_STORAGE = 0 };

typedef struct rg_entry_metadata_t {
    kt_char_ptr_t   name;
    rg_entry_t      type;         /* RG_TABLE */
    rg_storage_t    storage;      /* RG_UNKNOWN_STORAGE */
    kt_char_ptr_t * p_table_list; /* the whole list, the same in every entry */
} rg_entry_metadata_t;

KT_STATIC_ASSERT(sizeof(rg_entry_metadata_t) == 24 && offsetof(rg_entry_metadata_t, p_table_list) == 16,
                 "rg_entry_metadata_t");

/* As rg_list_tables_1, with an entry a table, to be given back through rg_i_free_directory_list_compat. Without tables
 * *entry_list is NULL and *array_count 0. Returns what rg_list_tables_1 returns. */
kt_int32_t rg_i_get_directory_list_compat(rg_opaque_handle_t tree_handle, kt_char_ptr_t directory_name,
                                          rg_entry_metadata_t ** entry_list, kt_uint32_t * array_count);
/* Gives such a list back. NULL is accepted. Returns 0. */
kt_int32_t rg_i_free_directory_list_compat(rg_entry_metadata_t * entry_list, kt_uint32_t array_count);
/* Do nothing, and return 0. */
kt_int32_t rg_i_create_directory_compat(void);
kt_int32_t rg_i_delete_directory_compat(void);

/* ---- Dumps for a person who hunts a fault ----------------------------------------------------------------------
 *
 * Outside the numbered interface: no lock is taken, no trace made, no error record set, and the lines may change. Keep
 * what is dumped still meanwhile: a row that goes away under a dump may take the process with it. */

struct rg_i_table_struct_t; /* a table's handle is the address of one */
struct rg_i_tree_struct_t;  /* and a tree's that of one of these */

/* Prints the inner state of a table. Printing the file's path (bit value 4194304) leaves a trace in the table: the path
 * buffer stands at the data file's name afterwards.
 *
 *   p_table       the table; NULL ends the dump after its first line
 *   p_stream      flushed after each item
 *   detail_flags  what to print, by bits: 1 name, 2 references, 4 number of columns, 8 to 1024 the parts of each
 *                 column, 2048 row counters, 4096 rows, 8192 their applied and 16384 their committed records, 32768
 *                 pointers, 65536 the application's data, 131072 to 4194304 the other fields, 8388608 the record
 *                 pool. All ones print everything, 0 nothing
 *
 * Returns 0. See docs/ARCHITECTURE.md. */
kt_int32_t rg_i_dump_table(struct rg_i_table_struct_t * p_table, FILE * p_stream, kt_uint64_t detail_flags);
/* Prints a tree, all of its tables with everything in them, and its mount points to standard output.
 *
 *   p_tree  the tree; NULL ends the dump after its first line
 *
 * Returns 0. */
kt_int32_t rg_i_dump_tree(struct rg_i_tree_struct_t * p_tree);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
