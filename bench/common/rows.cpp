// SPDX-License-Identifier: MIT
#include "common/rows.h"

#include <algorithm>
#include <cstdio>
#include <numeric>
#include <utility>

namespace bench
{

namespace
{

// A bijection without a pattern (the finisher of splitmix64).
std::uint64_t scrambled(std::uint64_t x)
{
    x += 0x9e3779b97f4a7c15u;
    x = (x ^ (x >> 30)) * 0xbf58476d1ce4e5b9u;
    x = (x ^ (x >> 27)) * 0x94d049bb133111ebu;
    return x ^ (x >> 31);
}

// Thirteen digits, no two ids below 2^26 with the same: the factor has no divisor in common with the modulus.
std::uint64_t digits_of(std::uint64_t id)
{
    return id * 61'803'398'749u % 10'000'000'000'000u;
}

std::vector<std::uint64_t> shuffled(std::size_t size)
{
    std::vector<std::uint64_t> ids(size);
    std::iota(ids.begin(), ids.end(), 0);
    for (std::size_t i = size; i > 1; --i)
        std::swap(ids[i - 1], ids[scrambled(i) % i]);
    return ids;
}

} // namespace

const char * criteria_of(filter wanted)
{
    switch (wanted) {
    case filter::everything:
        return "count >= 0";
    case filter::one_percent:
        return "count < 10";
    case filter::half:
        return "count < 500";
    case filter::three_conditions:
        break;
    }
    return "count > 499 && name like \"ab%\" && ratio < 0.99";
}

const char * sql_of(filter wanted)
{
    return wanted == filter::three_conditions ? "count > 499 and name like 'ab%' and ratio < 0.99"
                                              : criteria_of(wanted);
}

std::uint64_t digest(const row & r)
{
    return digest(r.id, r.count, r.ratio, r.name.view(), {r.note, note_length});
}

std::uint64_t copied_rows::drop()
{
    std::uint64_t sum = 0;
    for (const row & r : rows_)
        sum += digest(r);
    rows_.clear();
    return sum;
}

row row_of(std::uint64_t id)
{
    const std::uint64_t noise = scrambled(id);
    row                 r{};
    r.id    = id;
    r.count = static_cast<std::int64_t>(id * 7919 % 1000); // each of 0 to 999 once in a thousand rows
    r.ratio = static_cast<double>(noise % 10'000) / 10'000;
    std::snprintf(r.name.text, sizeof r.name.text, "%s-%013llu", noise >> 63 ? "ab" : "cd",
                  static_cast<unsigned long long>(digits_of(id)));
    std::snprintf(r.note, sizeof r.note, "checked %016llx%016llx", static_cast<unsigned long long>(noise),
                  static_cast<unsigned long long>(scrambled(noise)));
    return r;
}

data_set::data_set(std::size_t size) : ids_(shuffled(size)), count_sums_(size + 1), note_sums_(size + 1)
{
    rows_.reserve(size);
    for (std::size_t id = 0; id < size; ++id)
        rows_.push_back(row_of(id));
    names_.reserve(size);
    for (std::size_t i = 0; i < size; ++i) {
        const row & r      = rows_[ids_[i]];
        count_sums_[i + 1] = count_sums_[i] + digest(r.count);
        note_sums_[i + 1]  = note_sums_[i] + digest(std::string_view(r.note, note_length));
        names_.push_back(r.name);
    }
}

std::uint64_t data_set::sum(field wanted, std::size_t first, std::size_t count) const
{
    const std::vector<std::uint64_t> & sums = wanted == field::count ? count_sums_ : note_sums_;
    return sums[first + count] - sums[first];
}

std::size_t data_set::matching(filter wanted) const
{
    return with_predicate(wanted, [&](auto matches) {
        return static_cast<std::size_t>(std::count_if(
            rows_.begin(), rows_.end(), [&](const row & r) { return matches(r.count, r.name.view(), r.ratio); }));
    });
}

std::uint64_t data_set::digest_of(filter wanted) const
{
    return with_predicate(wanted, [&](auto matches) {
        std::uint64_t sum = 0;
        for (const row & r : rows_)
            sum += matches(r.count, r.name.view(), r.ratio) ? digest(r) : 0;
        return sum;
    });
}

std::vector<change> data_set::changes(std::int64_t step) const
{
    std::vector<change> all;
    all.reserve(ids_.size());
    for (const std::uint64_t id : ids_)
        all.push_back({id, (rows_[id].count + step) % 1000});
    return all;
}

} // namespace bench
