#include "support/temp-dir.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "base/glib-ptr.h"

TempDir::TempDir() {
  const GCharPtr made(g_dir_make_tmp("portd-unit-XXXXXX", nullptr));
  path_ = made ? made.get() : "/nonexistent";
  EXPECT_NE(made, nullptr) << "no directory for temporary files";
}

TempDir::~TempDir() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

std::string TempDir::path(std::string_view name) const {
  return path_ + "/" + std::string(name);
}

std::string TempDir::write(std::string_view name, std::string_view text) const {
  std::string file = path(name);
  std::ofstream(file, std::ios::binary) << text;
  return file;
}

std::string TempDir::make_directory(std::string_view name) const {
  std::string directory = path(name);
  std::filesystem::create_directory(directory);
  return directory;
}

std::string TempDir::read(std::string_view name) const {
  std::ifstream file(path(name), std::ios::binary);
  if (!file) {
    return "(no file)";
  }
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

std::vector<std::string> TempDir::names() const {
  std::vector<std::string> names;
  for (const auto &entry : std::filesystem::directory_iterator(path_)) {
    names.push_back(entry.path().filename());
  }
  std::sort(names.begin(), names.end());
  return names;
}
