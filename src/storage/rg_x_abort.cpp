// SPDX-License-Identifier: MIT
// rg_x_abort: the exported call of rg_i_abort.
#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_abort 1.0";

} // namespace

kt_int32_t rg_abort_1(rg_opaque_handle_t table_handle)
{
    return rg_i_transaction_call<entry_id::abort>(RG_HERE, table_handle,
                                                  [](rg_i_table_t & table) { return rg_i_abort(&table); });
}
