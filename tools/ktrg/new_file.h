// SPDX-License-Identifier: MIT
// new_file: a file that appears whole or not at all.
#pragma once

#include <string>

#include "output.h"

namespace ktrg
{

class new_file
{
  public:
    // Throws the failure of exit code 6 if the file exists and isn't to be replaced. `subject` is for messages.
    new_file(std::string path, std::string subject, bool replace);
    // Removes what was written, unless it was finished.
    ~new_file();
    new_file(const new_file &)             = delete;
    new_file & operator=(const new_file &) = delete;

    [[nodiscard]] output_sink & sink() { return *sink_; }
    // Gives the file its name, when all of it is on the disk.
    void finish();

  private:
    [[noreturn]] void refuse(int error) const;

    std::string                  path_;
    std::string                  subject_;
    std::string                  temporary_path_;
    int                          fd_ = -1;
    std::unique_ptr<output_sink> sink_;
};

// Refuses a file that exists and isn't to be replaced, or that is no regular file.
void check_new_file(const std::string & path, const std::string & subject, bool replace);

} // namespace ktrg
