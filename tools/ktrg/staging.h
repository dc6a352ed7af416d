// SPDX-License-Identifier: MIT
// staging: a directory of our own beside the targets, where tables are made before they take their names: so that a
// failure on the way leaves nothing half done, and the last step is a rename.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "hold.h"
#include "place.h"

namespace ktrg
{

class staging
{
  public:
    // Makes it in the directory of the place.
    explicit staging(const place & beside);
    // Removes it, with all that is in it.
    ~staging();
    staging(const staging &)             = delete;
    staging & operator=(const staging &) = delete;

    // The place in it for a table that is to become `target`, whose name it keeps for messages.
    [[nodiscard]] place place_for(const place & target) const;

  private:
    std::string              directory_;
    std::optional<file_hold> hold_; // tells that somebody is at work here
};

// Directories of that kind that killed processes left in the directory.
[[nodiscard]] std::vector<std::string> leftover_stagings(const std::string & directory);

// Removes one, unless somebody is at work in it: exit code 5.
void remove_staging(const std::string & path);

} // namespace ktrg
