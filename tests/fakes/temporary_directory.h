// SPDX-License-Identifier: Apache-2.0
// A directory that lives as long as its test. Test thread.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

namespace veltrad {

class TemporaryDirectory {
 public:
  TemporaryDirectory() {
    std::string pattern = ::testing::TempDir() + "veltra-XXXXXX";
    if (!::mkdtemp(pattern.data())) ADD_FAILURE() << "no temporary directory: " << pattern;
    _path = pattern;
  }
  ~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(_path, ignored);
  }
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

  std::string path(std::string_view name = "") const {
    return name.empty() ? _path : _path + "/" + std::string(name);
  }
  void write(std::string_view name, std::string_view bytes) const {
    std::ofstream(path(name), std::ios::binary) << bytes;
  }
  std::string read(std::string_view name) const {
    std::ifstream file(path(name), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }
  std::vector<std::string> names() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(_path))
      names.push_back(entry.path().filename());
    return names;
  }

 private:
  std::string _path;
};

}  // namespace veltrad
