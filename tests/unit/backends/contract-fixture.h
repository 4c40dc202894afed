// A backend under the contract, with the hardware that it drives.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

#include "base/unique-fd.h"
#include "support/iio-bench.h"

using Words = std::vector<std::string>;

// The hardware that the backends drive, and what the description says of it. The input rests in the
// state that a port calls inactive.
class World : public IioBench {
 public:
  // --- Hardware: the GPIO lines 1 to 4 are always there ---
  void make_nothing() {}
  void make_flag() { write("flag", "0\n"); }
  void make_spidev() { write("spidev", ""); }
  void make_buffered();
  void make_comparator();
  void make_box();
  // All of it goes away.
  void vanish();

  // --- What the hardware description says ---
  std::vector<Property> nothing() const { return {}; }
  std::vector<Property> lines() const;
  std::vector<Property> flag() const;
  std::vector<Property> recipe_file() const;
  std::vector<Property> converter() const;
  std::vector<Property> supervised_spi() const;
  std::vector<Property> supervised_iio() const;
  std::vector<Property> supervised_interrupt() const;

  // --- The input gets active ---
  void raise_line() { set_line(1, true); }
  void raise_flag() { write("flag", "1\n"); }
  void raise_spi_level();
  void raise_buffered_level();
  void raise_compared_level();
  void raise_box_state();

 protected:
  World();

 private:
  UniqueFd converter_;  // its end of the FIFO that the daemon reads
};

struct BackendUnderTest {
  const char *name;  // of the row
  const char *word;  // in the hardware description
  BackendKind kind;
  void (World::*furnish)() = &World::make_nothing;
  std::vector<Property> (World::*properties)() const = &World::nothing;
  void (World::*activate)() = nullptr;  // null: its ports report nothing by themselves
  PortType type = PORT_CONFIGURABLE;    // that it can be set up as
  bool supervisable = false;            // it has the slots of supervision
  bool measured = false;                // its ports are supervised from the start
  bool drops = false;                   // it has a drop of its own
};

std::vector<BackendUnderTest> all_backends();
std::vector<BackendUnderTest> supervisable_backends();
// For GoogleTest.
std::string name_of(const testing::TestParamInfo<BackendUnderTest> &backend);
void PrintTo(const BackendUnderTest &backend,  // NOLINT(readability-identifier-naming)
             std::ostream *out);

// What ports hold of the process.
struct Held {
  std::size_t sources;         // of the main loop
  Words watched;               // files that the main loop waits for
  std::size_t files;           // open ones
  std::size_t io_box_proxies;  // with their signal handlers

  bool operator==(const Held &) const = default;
};
void PrintTo(const Held &held, std::ostream *out);  // NOLINT(readability-identifier-naming)

// After each test the ports must have given back everything.
class BackendContract : public World, public testing::WithParamInterface<BackendUnderTest> {
 protected:
  BackendContract();
  void TearDown() override { expect_given_back(); }

  // --- Ports, numbered 1 ---
  // One that nothing was told about.
  static IOPortRef fresh(PortType type = PORT_INPUT) {
    return make_port(GetParam().kind, type, {});
  }
  IOPortRef described() const;
  IOPortRef set_up() const;
  IOPortRef watched() const;

  // Everything is there again that vanished.
  void appear();

  static void wait_until_box_idle();
  Held held() const;
  // Nothing is held but what was before the first port.
  void expect_given_back() const;

  // Lets the input get active, asks the port, lets all timers expire, and gives what was reported.
  Words reports_of_activation(const IOPortRef &port);
  // What that is while the port is watched.
  static Words one_report() { return GetParam().activate ? Words{"1 on"} : Words{}; }

 private:
  Held before_;
};
