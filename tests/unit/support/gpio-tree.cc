#include "support/gpio-tree.h"

#include <filesystem>
#include <fstream>
#include <sstream>
#include <utility>

#include "platform/host/ugpio-host.h"

namespace fs = std::filesystem;

GpioTree::GpioTree(std::string root) : root_(std::move(root)) {
  ugpio_host_set_root(root_);
  fs::create_directories(full("class/gpio"));
}

GpioTree::~GpioTree() {
  ugpio_host_set_root("/sys");
}

void GpioTree::make_line(int number) const {
  for (const auto &[name, text] : attributes) {
    write_file("class/gpio/gpio" + std::to_string(number) + "/" + name, text);
  }
}

std::string GpioTree::line_path(int number, const std::string &file) const {
  return full("class/gpio/gpio" + std::to_string(number) + "/" + file);
}

void GpioTree::write_file(const std::string &path, const std::string &text) const {
  fs::create_directories(fs::path(full(path)).parent_path());
  std::ofstream(full(path)) << text;
}

std::string GpioTree::read_file(const std::string &path) const {
  std::ostringstream text;
  text << std::ifstream(full(path)).rdbuf();
  return text.str();
}
