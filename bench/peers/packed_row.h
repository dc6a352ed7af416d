// SPDX-License-Identifier: MIT
// packed_row: a row as the value of a key-value store, laid out as its user would: fixed fields first, at known places,
// so that a field is read without unpacking anything. Host byte order. A column is added by appending a field to every
// row.
#ifndef PEERS_PACKED_ROW_H
#define PEERS_PACKED_ROW_H

#include <cstdint>
#include <cstring>
#include <string_view>

#include "store.h"

namespace peers
{

// Bytes 0 to 7 count, 8 to 15 ratio, 16 how long the second key is; then the second key and the note. The second key is
// the one that the row doesn't lie under: the name, or the eight bytes of the id.
class packed_row
{
  public:
    packed_row(const row & r, layout found_by)
    {
        std::memcpy(bytes_, &r.count, sizeof r.count);
        std::memcpy(bytes_ + 8, &r.ratio, sizeof r.ratio);
        const bool by_name     = found_by == layout::by_name;
        const auto second      = by_name ? sizeof r.id : name_length;
        bytes_[second_key - 1] = static_cast<char>(second);
        std::memcpy(bytes_ + second_key, by_name ? static_cast<const void *>(&r.id) : r.name.text, second);
        std::memcpy(bytes_ + second_key + second, r.note, note_length);
        length_ = second_key + second + note_length;
    }

    // A copy of a stored row.
    explicit packed_row(std::string_view stored) : length_(stored.size())
    {
        std::memcpy(bytes_, stored.data(), stored.size());
    }

    // A further field, behind all others.
    void append(std::int64_t added)
    {
        std::memcpy(bytes_ + length_, &added, sizeof added);
        length_ += sizeof added;
    }
    void cut() { length_ -= sizeof(std::int64_t); }

    void set_count(std::int64_t count) { std::memcpy(bytes_, &count, sizeof count); }

    [[nodiscard]] char *           data() { return bytes_; }
    [[nodiscard]] std::string_view view() const { return {bytes_, length_}; }

    static constexpr std::size_t second_key = 17;

  private:
    char        bytes_[second_key + name_length + note_length + sizeof(std::int64_t)];
    std::size_t length_;
};

// The fields of a stored row, read where it lies.
class stored_row
{
  public:
    explicit stored_row(std::string_view bytes) : bytes_(bytes) {}
    stored_row(const void * p_bytes, std::size_t length) : bytes_(static_cast<const char *>(p_bytes), length) {}

    [[nodiscard]] std::string_view bytes() const { return bytes_; }
    [[nodiscard]] std::int64_t     count() const { return load<std::int64_t>(0); }
    [[nodiscard]] double           ratio() const { return load<double>(8); }
    [[nodiscard]] std::string_view name() const { return bytes_.substr(packed_row::second_key, second_length()); }
    [[nodiscard]] std::string_view note() const
    {
        return bytes_.substr(packed_row::second_key + second_length(), note_length);
    }
    // The field behind all others, if one was appended.
    [[nodiscard]] std::int64_t added() const { return load<std::int64_t>(bytes_.size() - sizeof(std::int64_t)); }

    // The digest of one field, of a copy if it is a text.
    [[nodiscard]] std::uint64_t digest_of(field wanted) const
    {
        if (wanted == field::count)
            return digest(count());
        char note_copy[note_length];
        std::memcpy(note_copy, note().data(), note_length);
        asm volatile("" : : "r"(note_copy) : "memory"); // the copy is made, though only some of it is looked at
        return digest(std::string_view(note_copy, note_length));
    }

    [[nodiscard]] row unpacked(std::uint64_t id) const
    {
        row r;
        r.id    = id;
        r.count = count();
        r.ratio = ratio();
        std::memcpy(r.name.text, name().data(), name_length);
        std::memcpy(r.note, note().data(), note_length);
        r.name.text[name_length] = r.note[note_length] = '\0';
        return r;
    }

  private:
    [[nodiscard]] std::size_t second_length() const
    {
        return static_cast<unsigned char>(bytes_[packed_row::second_key - 1]);
    }

    template <class T> [[nodiscard]] T load(std::size_t at) const
    {
        T value;
        std::memcpy(&value, bytes_.data() + at, sizeof value);
        return value;
    }

    std::string_view bytes_;
};

} // namespace peers

#endif
