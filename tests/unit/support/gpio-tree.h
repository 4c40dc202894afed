// The kernel's files of GPIO lines, in a folder that the GPIO library finds in place of /sys.
#pragma once

#include <map>
#include <string>

class GpioTree {
 public:
  explicit GpioTree(std::string root);
  ~GpioTree();
  GpioTree(const GpioTree &) = delete;
  GpioTree &operator=(const GpioTree &) = delete;

  // What the files of a line hold that is made, and which it has.
  std::map<std::string, std::string> attributes = {
      {"direction", "in\n"}, {"edge", "none\n"}, {"active_low", "0\n"}, {"value", "0\n"}};

  // An exported line.
  void make_line(int number) const;
  // The path of a file of the line.
  std::string line_path(int number, const std::string &file) const;
  // Paths below the tree's folder.
  std::string full(const std::string &path) const { return root_ + "/" + path; }
  void write_file(const std::string &path, const std::string &text) const;
  std::string read_file(const std::string &path) const;

 private:
  std::string root_;
};
