// A directory that is removed with everything in it.
#pragma once

#include <string>
#include <string_view>
#include <vector>

class TempDir {
 public:
  TempDir();
  ~TempDir();
  TempDir(const TempDir &) = delete;
  TempDir &operator=(const TempDir &) = delete;

  std::string path(std::string_view name) const;
  const std::string &path() const { return path_; }
  // Writes the file and gives its path.
  std::string write(std::string_view name, std::string_view text) const;
  // Makes the directory and gives its path.
  std::string make_directory(std::string_view name) const;
  // The contents of the file, or "(no file)".
  std::string read(std::string_view name) const;
  // What the directory holds, sorted by name.
  std::vector<std::string> names() const;

 private:
  std::string path_;
};
