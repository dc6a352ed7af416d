// SPDX-License-Identifier: MIT
// rows: what every store is filled with, in what order it is asked, and what it has to answer.
#ifndef BENCH_ROWS_H
#define BENCH_ROWS_H

#include <cstdint>
#include <cstring>
#include <deque>
#include <span>
#include <string_view>
#include <vector>

namespace bench
{

constexpr std::size_t name_length = 16;
constexpr std::size_t note_length = 40;

struct name_text {
    char text[name_length + 1];

    [[nodiscard]] std::string_view view() const { return {text, name_length}; }
};

// A row as a program has it in its hands.
struct row {
    std::uint64_t id;
    std::int64_t  count;
    double        ratio;
    name_text     name;
    char          note[note_length + 1];
};

struct change {
    std::uint64_t id;
    std::int64_t  count;
};

// What a scan looks for.
enum class filter { everything, one_percent, half, three_conditions };

// Runs action with a predicate of count, name and ratio, so that a loop inside is compiled for each filter by itself.
template <class Action> auto with_predicate(filter wanted, Action action)
{
    switch (wanted) {
    case filter::everything:
        return action([](std::int64_t count, std::string_view, double) { return count >= 0; });
    case filter::one_percent:
        return action([](std::int64_t count, std::string_view, double) { return count < 10; });
    case filter::half:
        return action([](std::int64_t count, std::string_view, double) { return count < 500; });
    case filter::three_conditions:
        break;
    }
    return action([](std::int64_t count, std::string_view name, double ratio) {
        return count > 499 && name.starts_with("ab") && ratio < 0.99;
    });
}

// The same as text. Both C and SQL spell it so but for the quotes and the conjunction.
const char * criteria_of(filter wanted);
const char * sql_of(filter wanted);

// ---- Digests: what is summed up to see that each store delivers the same ----

inline std::uint64_t digest(std::int64_t count)
{
    return static_cast<std::uint64_t>(count);
}

// Of a text of at least eight bytes.
inline std::uint64_t digest(std::string_view text)
{
    std::uint64_t first;
    std::uint64_t last;
    std::memcpy(&first, text.data(), sizeof first);
    std::memcpy(&last, text.data() + text.size() - sizeof last, sizeof last);
    return first + 3 * last + text.size();
}

inline std::uint64_t digest(double ratio)
{
    std::uint64_t bits;
    std::memcpy(&bits, &ratio, sizeof bits);
    return bits;
}

inline std::uint64_t digest(std::uint64_t id, std::int64_t count, double ratio, std::string_view name,
                            std::string_view note)
{
    return id + digest(count) + digest(ratio) + digest(name) + digest(note);
}

std::uint64_t digest(const row & r);

// Rows that were copied out of a store.
class copied_rows
{
  public:
    void                      add(const row & r) { rows_.push_back(r); }
    [[nodiscard]] std::size_t size() const { return rows_.size(); }

    // The digest of all of them, which are given up.
    std::uint64_t drop();

  private:
    std::deque<row> rows_; // none of them moves when there are more
};

// ---- The rows of one size ----

row row_of(std::uint64_t id);

enum class field { count, note };

// Rows 0 to size - 1, and their keys in an order that no cache foresees, the same in each run.
class data_set
{
  public:
    explicit data_set(std::size_t size);

    [[nodiscard]] std::size_t                    size() const { return rows_.size(); }
    [[nodiscard]] std::span<const row>           rows() const { return rows_; }
    [[nodiscard]] std::span<const std::uint64_t> ids() const { return ids_; }
    [[nodiscard]] std::span<const name_text>     names() const { return names_; }

    // What reading that field of the rows at shuffled places first to first + count - 1 sums up to.
    [[nodiscard]] std::uint64_t sum(field wanted, std::size_t first, std::size_t count) const;
    // How many rows match, and what they sum up to.
    [[nodiscard]] std::size_t   matching(filter wanted) const;
    [[nodiscard]] std::uint64_t digest_of(filter wanted) const;
    // The counts of all rows, moved on so far; in shuffled order. The same share of rows matches each filter.
    [[nodiscard]] std::vector<change> changes(std::int64_t step) const;

  private:
    std::vector<row>           rows_;
    std::vector<std::uint64_t> ids_;
    std::vector<name_text>     names_;
    std::vector<std::uint64_t> count_sums_; // of the first n shuffled rows
    std::vector<std::uint64_t> note_sums_;
};

} // namespace bench

#endif
