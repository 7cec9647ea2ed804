// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tools/install/contents.h"
#include "tools/install/files.h"

// Writes what it receives into a directory that is there and empty: directories
// with the mode 755, files with 644, each synced before the next. A call that
// fails throws `failure`.
class copy final : public receiver {
 public:
  // `top` stays open meanwhile; `path` is what lines call it.
  copy(int top, std::string path);
  void enter(const std::string& path) override;
  void leave(const std::string& path) override;
  void file(const std::string& path, std::string_view content) override;
  void name(const std::string& path, const std::string& of) override;
  void link(const std::string& path, const std::string& text) override;
  void end() override;

 private:
  int here() const;
  std::string shown(const std::string& path) const;

  int top_;
  std::string path_;
  std::vector<descriptor> open_{};  // the directories that were entered
};
