// SPDX-License-Identifier: MIT
// stored_value_fuzz: any bytes as a stored value: read, built again, and turned to the other byte order and back.
//
// The input is a type, a byte of choices, a slot, and the indirect data, which is given to the library in a block of
// exactly its length.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "../support/pmsg/kt_pmsg_i_convert.h"
#include "../tests/pmsg/value_kit.h"

using namespace kt_test;
using kt_pmsg_i::reverse_value;
using kt_pmsg_i::word_order;

namespace
{

// Survives NDEBUG: this is what the fuzzer looks for.
void require(bool condition)
{
    if (!condition)
        std::abort();
}

ku_iconv_t * latin1(kt_int32_t flags)
{
    ku_iconv_t * p_handle = nullptr;
    require(ku_iconv_open_1("ISO-8859-1", flags, &p_handle) == 0);
    return p_handle;
}

struct input {
    kt_data_type_t                  type;
    std::uint8_t                    slot[8];
    std::unique_ptr<std::uint8_t[]> area;
    kt_pmsg_len_t                   length;
};

void read_and_build(const input & in, ku_iconv_t * p_from_table, ku_iconv_t * p_to_table)
{
    kt_value_t       value;
    const kt_int32_t rc =
        kt_pmsg_build_conv_packed_client_value_1(p_from_table, 0, in.type, &value, in.slot, in.area.get(), in.length);
    require(rc >= 0 && rc <= KT_PMSG_E_DAMAGED);
    if (rc != 0)
        return;

    const model   m        = model_of(in.type, value);
    const octets  expected = is_number(in.type) ? octets{} : item_of(m, machine::here);
    kt_pmsg_len_t size     = 0;
    require(kt_pmsg_size_conv_protocol_value_1(1, 0, in.type, &value, &size) == 0);
    require(size == expected.size());
    require(size <= 2 * std::size_t{in.length} + 1);

    octets        built(size);
    std::uint8_t  slot[8];
    kt_pmsg_off_t offset = 0;
    if (size != 0) {
        require(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, in.type, &value, slot, built.data(), size - 1,
                                                    &offset) == KT_PMSG_E_NO_ROOM);
        require(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, in.type, &value, slot, built.data(), size, &offset) ==
                0);
        require(offset == size && built == expected);
    }
    // What came out of the client's code set goes back into the table's.
    if (p_to_table != nullptr) {
        built.resize(4 * std::size_t{size} + 8);
        offset = 0;
        require(kt_pmsg_build_conv_protocol_value_1(p_to_table, 0, in.type, &value, slot, built.data(),
                                                    static_cast<kt_pmsg_len_t>(built.size()), &offset) == 0);
    }
    if (!is_number(in.type))
        std::free(value.ptr_char);
}

bool holds_sbs(const model & m)
{
    return m.type == KT_SBS_PTR || std::any_of(m.elements.begin(), m.elements.end(), holds_sbs);
}

octets all_bytes(const input & in)
{
    octets result(in.slot, in.slot + 8);
    result.insert(result.end(), in.area.get(), in.area.get() + in.length);
    return result;
}

void turn(input & in, word_order order)
{
    require(reverse_value(order, in.slot, in.type, in.area.get(), in.length) == 0);
}

void turn_and_turn_back(input & in, word_order order)
{
    const octets     original = all_bytes(in);
    const kt_int32_t rc       = reverse_value(order, in.slot, in.type, in.area.get(), in.length);
    if (rc != 0) {
        require(rc == KT_PMSG_E_DAMAGED || rc == KT_PMSG_E_UNSUPPORTED_TYPE);
        require(all_bytes(in) == original);
        return;
    }
    const octets turned = all_bytes(in);
    turn(in, opposite(order));
    // Bytes of an SBS that are no fields in one order may be fields in the other, so only the second turn is undone.
    const octets back = all_bytes(in);
    turn(in, order);
    require(all_bytes(in) == turned);
    turn(in, opposite(order));
    require(all_bytes(in) == back);
    if (order == word_order::foreign)
        return;
    // Everything is in local order now, and can be read.
    kt_value_t value;
    require(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, in.type, &value, in.slot, in.area.get(), in.length) ==
            0);
    require(back == original || holds_sbs(model_of(in.type, value)));
    if (!is_number(in.type))
        std::free(value.ptr_char);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t * p_data, std::size_t size)
{
    static ku_iconv_t * const p_to_table   = latin1(KU_ICONV_TO_TABLE);
    static ku_iconv_t * const p_from_table = latin1(KU_ICONV_FROM_TABLE);
    if (size < 10)
        return 0;
    input in;
    in.type   = p_data[0] % 24;
    in.length = static_cast<kt_pmsg_len_t>(size - 10);
    in.area   = std::make_unique<std::uint8_t[]>(in.length);
    std::memcpy(in.slot, p_data + 2, 8);
    std::memcpy(in.area.get(), p_data + 10, in.length);

    const bool converting_strings = (p_data[1] & 1) != 0;
    const auto order              = (p_data[1] & 2) != 0 ? word_order::foreign : word_order::local;
    // The slot names the whole area, unless the input chooses its own.
    if ((p_data[1] & 4) == 0 && !is_number(in.type)) {
        octets anchor;
        append(anchor, kt_uint32_t{0}, order == word_order::local ? machine::here : machine::other);
        append(anchor, in.length, order == word_order::local ? machine::here : machine::other);
        std::memcpy(in.slot, anchor.data(), 8);
    }

    turn_and_turn_back(in, order);
    read_and_build(in, converting_strings ? p_from_table : nullptr, converting_strings ? p_to_table : nullptr);
    return 0;
}
