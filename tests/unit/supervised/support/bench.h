// A bench for supervised ports: a sysfs tree with GPIO lines in a folder of its own, timers that
// only run when the test says so, and everything that is logged or reported written down.
#pragma once

#include <glib.h>
#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "port/ioport.h"
#include "support/gpio-tree.h"

// One attribute of the hardware description.
struct Property {
  const char *section;
  const char *key;
  std::string value;
};

class Bench : public testing::Test {
 protected:
  Bench();
  ~Bench() override;

  // --- Files, all below the bench's folder ---
  std::string path(std::string_view name) const { return root_ + "/" + std::string(name); }
  void write(std::string_view name, std::string_view text) const;
  // What the file holds; "(none)" when there is no such file.
  std::string read(std::string_view name) const;
  void remove(std::string_view name) const;
  // Puts a directory where the file is, which nothing can write then, or takes it away again.
  void block(std::string_view name) const;

  // What the next reads of whole files give, whatever the files hold.
  static void texts_to_come(const std::vector<std::string> &texts);

  // --- GPIO lines ---
  void make_line(int number) const;
  void set_line(int number, bool level) const;
  bool line(int number) const;
  // From now on the line can neither be read nor driven, also through open descriptors.
  void break_line(int number) const;
  // From now on the device of that path can't be read.
  void break_reads(std::string_view name) const;
  static void mend_lines();  // and devices

  // --- Ports ---
  // A port with its backend bound and the properties applied, numbered 1.
  static IOPortRef make_port(BackendKind kind, PortType type,
                             const std::vector<Property> &properties);
  // Gives the port an event that tells the state of its line while it is supervised.
  static void add_supervised_event(const IOPortRef &port);
  static SupervisedRanges ranges_of(const IOPortRef &port);
  // "closed 150", or "error CODE: MESSAGE".
  static std::string readout(const IOPortRef &port);
  // Control pins are those of an input: driving them for an output dies with that place.
  static void expect_control_pins_die_for_an_output(const IOPortRef &port, const char *place);

  // --- Reports: "1 on" for PortChanged of port 1, "event cut" for an event ---
  static std::vector<std::string> reports();

  // --- The log: "critical: text" ---
  static std::vector<std::string> logged();
  static bool was_logged(std::string_view line);

  // --- The main loop ---
  // Runs what is ready. A loop that always has something to do fails the test.
  static void iterate();
  // How many sources of any kind there are: timers, watches of descriptors, idle ones.
  static std::size_t sources();
  // The intervals of the armed timers, oldest first.
  static std::vector<guint> timers();
  // Lets every armed timer of that interval expire once.
  static void expire(guint interval);
  // The same for every interval that a timer is armed with.
  static void expire_all();

  std::string root_;

 private:
  GpioTree lines_;
};
