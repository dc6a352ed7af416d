// SPDX-License-Identifier: MIT
// tr_components: the components that registered, and their level bytes.
//
// Always holds: an entry of the table, once published, never changes; only the level bytes do, and they are the
// component's own. They are written one by one with no order between them: a component that reads a stale level makes
// or drops one event more.
// Locking: none. Entries are claimed by counting up and published one by one, so a thread may register while others
// record, and a forked child finds no lock held.
// Failure: a component that finds the table full isn't traced.
#include "tr_components.h"

#include <cstdlib>
#include <cstring>
#include <string_view>

std::atomic<kt_uint32_t> Tr_I_Wanted{0};

namespace
{

constexpr kt_uint32_t most_components    = 128;
constexpr size_t      component_name_max = 31;
constexpr kt_uint32_t highest_level      = 255;

struct component_entry {
    std::atomic<bool>                 published;
    char                              name[component_name_max + 1];
    tr_detail_level_t *               p_levels;
    const tr_category_description_t * p_categories;
    kt_uint32_t                       total_categories;
};

component_entry          Components[most_components];
std::atomic<kt_uint32_t> Claimed_Entries{0};

template <class Visit> void for_each_component(Visit visit)
{
    const kt_uint32_t claimed = Claimed_Entries.load(std::memory_order_acquire);
    for (kt_uint32_t i = 0; i < claimed && i < most_components; i++) {
        if (Components[i].published.load(std::memory_order_acquire))
            visit(Components[i]);
    }
}

bool is_registered(const kt_char_t * p_component, const tr_detail_level_t * p_levels)
{
    bool found = false;
    for_each_component([&](const component_entry & entry) {
        found = found || (entry.p_levels == p_levels && std::strcmp(entry.name, p_component) == 0);
    });
    return found;
}

// No level goes below what the category's owner always wants to see.
void set_level(const component_entry & entry, kt_uint32_t category, kt_uint32_t level)
{
    if (level < entry.p_categories[category].minimum_level_of_detail)
        level = entry.p_categories[category].minimum_level_of_detail;
    if (level > highest_level)
        level = highest_level;
    if (level != 0)
        Tr_I_Wanted.fetch_or(TR_I_LEVELS_WERE_SET);
    std::atomic_ref<tr_detail_level_t>(entry.p_levels[category])
        .store(static_cast<tr_detail_level_t>(level), std::memory_order_relaxed);
}

// Whether the entry has a category of this name; sets its level. "*" names them all.
bool set_level_by_name(const component_entry & entry, std::string_view category_name, kt_uint32_t level)
{
    bool found = false;
    for (kt_uint32_t i = 0; i < entry.total_categories; i++) {
        if (category_name == "*" || category_name == entry.p_categories[i].category_name) {
            set_level(entry, i, level);
            found = true;
        }
    }
    return found;
}

std::string_view take_until(std::string_view & rest, char delimiter)
{
    const size_t           position = rest.find(delimiter);
    const std::string_view taken(rest.data(), position == std::string_view::npos ? rest.size() : position);
    rest.remove_prefix(position == std::string_view::npos ? rest.size() : position + 1);
    return taken;
}

bool read_level(std::string_view text, kt_uint32_t & level)
{
    level = 0;
    for (const char c : text) {
        if (c < '0' || c > '9')
            return false;
        level = level * 10 + static_cast<kt_uint32_t>(c - '0');
        if (level > highest_level)
            level = highest_level;
    }
    return !text.empty();
}

// "_RGA:API=1,Errors=1;OTHER:*=255". What isn't of this form, or names what nobody has, is passed over.
void apply_environment(const component_entry & entry)
{
    const char * p_setting = std::getenv("KT_TRACE");
    if (p_setting == nullptr)
        return;
    std::string_view rest = p_setting;
    while (!rest.empty()) {
        std::string_view settings = take_until(rest, ';');
        if (take_until(settings, ':') != entry.name)
            continue;
        while (!settings.empty()) {
            std::string_view       level_text    = take_until(settings, ',');
            const std::string_view category_name = take_until(level_text, '=');
            if (kt_uint32_t level = 0; read_level(level_text, level))
                set_level_by_name(entry, category_name, level);
        }
    }
}

} // namespace

bool tr_i_component_is_traced(const kt_char_t * p_component)
{
    bool traced = false;
    for_each_component([&](const component_entry & entry) {
        if (traced || std::strcmp(entry.name, p_component) != 0)
            return;
        for (kt_uint32_t i = 0; i < entry.total_categories && !traced; i++) {
            traced = std::atomic_ref<tr_detail_level_t>(entry.p_levels[i]).load(std::memory_order_relaxed) != 0;
        }
    });
    return traced;
}

extern "C" void tr_register_component_1(const kt_char_t * p_component, tr_detail_level_t * p_levels,
                                        const tr_category_description_t * p_categories, kt_uint32_t total_categories)
{
    if (p_component == nullptr || p_levels == nullptr || p_categories == nullptr ||
        std::strlen(p_component) > component_name_max || is_registered(p_component, p_levels))
        return;
    const kt_uint32_t index = Claimed_Entries.fetch_add(1);
    if (index >= most_components) {
        Claimed_Entries.store(most_components);
        return;
    }

    component_entry & entry = Components[index];
    std::strcpy(entry.name, p_component);
    entry.p_levels         = p_levels;
    entry.p_categories     = p_categories;
    entry.total_categories = total_categories;
    for (kt_uint32_t i = 0; i < total_categories; i++)
        set_level(entry, i, p_categories[i].default_level_of_detail);
    apply_environment(entry);
    entry.published.store(true, std::memory_order_release);
}

extern "C" kt_int32_t tr_set_level_1(const kt_char_t * p_component, const kt_char_t * p_category_name,
                                     kt_uint32_t level)
{
    if (p_component == nullptr)
        return TR_E_UNKNOWN_COMPONENT;
    const std::string_view category_name   = p_category_name != nullptr ? p_category_name : "*";
    bool                   component_found = false, category_found = false;
    for_each_component([&](const component_entry & entry) {
        if (std::strcmp(entry.name, p_component) != 0)
            return;
        component_found = true;
        category_found  = set_level_by_name(entry, category_name, level) || category_found;
    });
    if (!component_found)
        return TR_E_UNKNOWN_COMPONENT;
    return category_found ? 0 : TR_E_UNKNOWN_CATEGORY;
}
