#include <kt_ku.h>
#include <kt_rg.h>
#include <stdio.h>

int main(void)
{
    rg_column_t   columns[] = {{"name", KT_CHAR_PTR, RG_PRIMARY_KEY}, {"load", KT_FLOAT64, RG_STANDARD}};
    kt_char_ptr_t names[]   = {"name", "load"};
    kt_value_t    name = {.ptr_char = "alpha"}, load = {.val_float64 = 0.25}, *row[] = {&name, &load};

    rg_opaque_handle_t tree, hosts;
    if (rg_open_tree_1(&tree, 0, 0) == 0 && rg_mount_local_tree_1(tree, "/state", "state", 1) == 0 &&
        rg_create_table_1(tree, "/state/hosts", columns, 2, RG_MODE_WRITE, &hosts) == 0 &&
        rg_add_row_1(hosts, names, row, 2) == 0 && /* written and synced when it returns */
        rg_get_field_by_key_1(hosts, name, "load", &load) == 0) {
        printf("%s has a load of %.2f\n", name.ptr_char, load.val_float64);
        return rg_close_tree_1(tree);
    }
    ku_error_record_t error;
    ku_get_error_record_1(&error);
    return fputs(error.p_text, stderr), error.code;
}
