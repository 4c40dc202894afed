#include "kernel-tree.h"

#include <glib.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "platform/host/ugpio-host.h"

namespace fs = std::filesystem;

// The linker's option --wrap gives the calls and the real functions these names.
ssize_t fake_write(int fd, const void *data, size_t size) asm("__wrap_write");
ssize_t real_write(int fd, const void *data, size_t size) asm("__real_write");
// Large files have calls of their own on some machines.
ssize_t fake_pread(int fd, void *data, size_t size, off_t offset) asm("__wrap_pread");
ssize_t fake_pread64(int fd, void *data, size_t size, off64_t offset) asm("__wrap_pread64");
ssize_t real_pread64(int fd, void *data, size_t size, off64_t offset) asm("__real_pread64");
void fake_usleep(gulong microseconds) asm("__wrap_g_usleep");
gint64 fake_monotonic_time() asm("__wrap_g_get_monotonic_time");

namespace {

constexpr const char *kClass = "class/gpio/";
constexpr gint64 kStart = 1000 * G_TIME_SPAN_SECOND;

KernelTree *current = nullptr;

// The file's name within class/gpio of the tree; empty for files elsewhere.
std::string tree_file(int fd) {
  std::error_code error;
  const std::string path = fs::read_symlink("/proc/self/fd/" + std::to_string(fd), error).string();
  const std::string base = (fs::path(ugpio_host_root()) / kClass).string();
  return path.starts_with(base) ? path.substr(base.size()) : "";
}

std::string make_root() {
  std::string path = (fs::temp_directory_path() / "portd-gpio-XXXXXX").string();
  std::string root = g_mkdtemp(path.data());
  // Tests that do without root's rights must still come in.
  fs::permissions(root, fs::perms(0755));
  return root;
}

}  // namespace

KernelTree::KernelTree() : GpioTree(make_root()) {
  write_file(std::string(kClass) + "export", "");
  write_file(std::string(kClass) + "unexport", "");
  current = this;
}

KernelTree::~KernelTree() {
  current = nullptr;
  std::error_code error;
  fs::remove_all(full(""), error);
}

void KernelTree::remove(const std::string &path) const {
  fs::remove_all(full(path));
}

void KernelTree::set_mode(const std::string &path, unsigned int mode) const {
  fs::permissions(full(path), fs::perms(mode));
}

void KernelTree::make_link(const std::string &path, const std::string &target) const {
  fs::create_directories(fs::path(full(path)).parent_path());
  fs::create_directory_symlink(full(target), full(path));
}

int KernelTree::on_write(const std::string &file, const std::string &text) {
  writes.push_back(file + " " + text);
  if (file == "export" && on_export) {
    on_export();
  }
  const auto error = errors.find(fs::path(file).filename().string());
  if (error != errors.end()) {
    return error->second;
  }
  if (file == "export" && exports) {
    make_line(std::stoi(text));
  } else if (file == "unexport") {
    remove(kClass + ("gpio" + text));
  }
  return 0;
}

ssize_t fake_write(int fd, const void *data, size_t size) {
  const std::string file = current ? tree_file(fd) : "";
  if (current && !file.empty()) {
    if (const int error =
            current->on_write(file, std::string(static_cast<const char *>(data), size))) {
      errno = error;
      return -1;
    }
  }
  return real_write(fd, data, size);
}

ssize_t fake_pread64(int fd, void *data, size_t size, off64_t offset) {
  if (current) {
    ++current->reads;
  }
  return real_pread64(fd, data, size, offset);
}

ssize_t fake_pread(int fd, void *data, size_t size, off_t offset) {
  return fake_pread64(fd, data, size, offset);
}

void fake_usleep(gulong microseconds) {
  current->slept += static_cast<long>(microseconds);
  if (current->on_sleep) {
    current->on_sleep();
  }
}

gint64 fake_monotonic_time() {
  return kStart + (current ? current->slept : 0);
}
