// sysfs GPIO played by a directory tree. The linker redirects the library's write and sleep calls
// here, so that a write to `export` makes the line's files, as the kernel does, and time passes
// only in the library's own sleeps.
#pragma once

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "support/gpio-tree.h"

class KernelTree : public GpioTree {
 public:
  KernelTree();
  ~KernelTree();

  bool exports = true;                // a write to `export` makes the line
  std::map<std::string, int> errors;  // by file name: the errno of every write to it
  std::vector<std::string> writes;    // "gpio12/direction high", "export 12", in order
  std::function<void()> on_export;    // called for every write to `export`, before anything else
  std::function<void()> on_sleep;     // called for every sleep of the library
  int reads = 0;                      // of open files at a position
  long slept = 0;                     // microseconds

  void remove(const std::string &path) const;
  void set_mode(const std::string &path, unsigned int mode) const;
  void make_link(const std::string &path, const std::string &target) const;

  // The errno of a write to a file of the tree; 0 when it succeeds.
  int on_write(const std::string &file, const std::string &text);
};
