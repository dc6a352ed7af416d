// SPDX-License-Identifier: MIT
// packed_file: a file in the packed form, docs/PACKED-FORMAT.md, from anybody.
//
// It is read whole and converted to this machine's byte order. What it says of its own length must be its length; all
// else is checked by the library, value by value.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "registry.h"

namespace ktrg
{

// What a packed table tells of itself without being unpacked.
struct packed_table {
    std::string    path;        // registry path on the sender, the name that the library gives it
    std::string    sender_name; // the path of its file on the sender, or its path again if it had none
    std::string    file_name;   // what unpack calls it; empty: no file can have its name
    std::uint64_t  counter  = 0;
    std::uint64_t  bytes    = 0; // of its four items
    std::uint64_t  rows     = 0; // on the sender
    kt_data_type_t key_type = KT_UNKNOWN;
};

class packed_file
{
  public:
    // Throws the failure of exit code 4 for what is damaged, or no packed file.
    static packed_file read(const std::string & file);

    [[nodiscard]] bool                              big_endian() const { return big_endian_; }
    [[nodiscard]] std::uint64_t                     bytes() const { return content_.size(); }
    [[nodiscard]] const std::string &               name() const { return name_; }
    [[nodiscard]] const std::vector<packed_table> & tables() const { return tables_; }

    // The table as one in memory that can be read, with each of its values looked at. It is at `target` for messages.
    [[nodiscard]] table unpack(std::size_t index, const place & target);

  private:
    [[nodiscard]] failure      damaged(std::string_view what) const;
    void                       check_header();
    [[nodiscard]] packed_table describe(std::size_t index);
    [[nodiscard]] kt_uint32_t  word(std::uint64_t offset) const;

    std::string               name_;
    std::string               content_;
    bool                      big_endian_ = false;
    std::vector<packed_table> tables_;
};

} // namespace ktrg
