/* SPDX-License-Identifier: MIT
 *
 * killed_writer DIRECTORY TABLE COLUMN ROWS: dies in the middle of a transaction, on purpose.
 *
 * Opens the table in explicit control, adds rows with new keys (COLUMN is the key, a string), applies them, which
 * writes them to the file and syncs it, and is killed ahead of the commit. Whoever opens the table afterwards finds it
 * as the last commit left it: the new rows lie in the file behind the commit record that readers stop at.
 */
#include <kt_ku.h>
#include <kt_rg.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>

static int fail(const char * p_what)
{
    ku_error_record_t error;
    ku_get_error_record_1(&error);
    fprintf(stderr, "killed_writer: %s: %s", p_what, error.p_text);
    return 1;
}

static int add_rows(rg_opaque_handle_t table, char * p_column, int rows)
{
    for (int i = 1; i <= rows; i++) {
        char          text[64];
        kt_value_t    key   = {.ptr_char = text};
        kt_value_t *  row[] = {&key};
        kt_char_ptr_t name  = p_column;
        snprintf(text, sizeof text, "never-committed-%d", i);
        if (rg_add_row_1(table, &name, row, 1) != 0)
            return 1;
    }
    return 0;
}

int main(int argc, char ** argv)
{
    if (argc != 5)
        return fprintf(stderr, "usage: killed_writer DIRECTORY TABLE COLUMN ROWS\n"), 2;
    char path[256];
    snprintf(path, sizeof path, "/t/%s", argv[2]);

    rg_opaque_handle_t tree, table;
    if (rg_open_tree_1(&tree, 0, 0) != 0 || rg_mount_local_tree_1(tree, "/t", argv[1], 1) != 0)
        return fail("mount");
    if (rg_open_table_1(tree, path, RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL, &table) != 0)
        return fail("open");
    if (add_rows(table, argv[3], atoi(argv[4])) != 0)
        return fail("add");
    if (rg_apply_1(table, 0) != 0)
        return fail("apply");
    printf("%s rows are added and applied: written and synced, but not committed\n", argv[4]);
    fflush(stdout);
    raise(SIGKILL);
    return 1;
}
