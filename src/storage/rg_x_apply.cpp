// SPDX-License-Identifier: MIT
// rg_x_apply: the exported call of rg_i_apply.
#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_apply 1.0";

} // namespace

kt_int32_t rg_apply_1(rg_opaque_handle_t table_handle, kt_uint64_t table_change_counter)
{
    return rg_i_transaction_call<entry_id::apply>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_apply(&table, rg_i_rewrite_is_due(&table), table_change_counter);
    });
}
