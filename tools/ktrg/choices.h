// SPDX-License-Identifier: MIT
// choices: an option that takes one of a few words.
#pragma once

#include <string>
#include <vector>

#include <CLI/CLI.hpp>

namespace ktrg
{

// Without the list that CLI11 would repeat in the help.
inline CLI::Validator one_of(const std::vector<std::string> & words)
{
    return CLI::IsMember(words).description("");
}

} // namespace ktrg
