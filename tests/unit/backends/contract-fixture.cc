#include "contract-fixture.h"

#include <linux/iio/events.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <ostream>
#include <utility>

#include "backends/iobox-backend.h"
#include "fake-io-box.h"
#include "port/ioport-private.h"
#include "support/fake-ioctl.h"

extern const PortFunctions kToyBackend;

namespace {

constexpr unsigned int kActiveLevel = 150;
constexpr std::size_t kSharedProxies = 1;  // all ports on boxes have one
constexpr unsigned int kRestingLevel = 250;

std::vector<Property> join(std::vector<Property> first, const std::vector<Property> &second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

void set_spi_level(unsigned int level) {
  fake_spidev().answer_sample(static_cast<int>(level));
}

std::vector<Property> pins() {
  return {{"input", "pin", "1"},
          {"output", "pin", "2"},
          {"io_ctrl", "pin", "3"},
          {"sio_ctrl", "pin", "4"}};
}

std::vector<Property> ranges() {
  return {{"range", "state", "closed"}, {"range", "lower", "100"}, {"range", "upper", "200"},
          {"range", "state", "open"},   {"range", "lower", "201"}, {"range", "upper", "300"}};
}

// Far from those that the table of backends has, or may come to have.
constexpr auto kToyKind = static_cast<BackendKind>(99);
constexpr Backend kToyRow = {"recipe", kToyKind, &kToyBackend};

const std::vector<BackendUnderTest> kPlain = {
    {.name = "virtual", .word = "virtual", .kind = BACKEND_VIRTUAL},
    {.name = "gpio",
     .word = "gpio",
     .kind = BACKEND_GPIO,
     .properties = &World::lines,
     .activate = &World::raise_line},
    {.name = "spiadc",
     .word = "spiadc",
     .kind = BACKEND_SPIADC,
     .furnish = &World::make_spidev,
     .properties = &World::converter,
     .activate = &World::raise_spi_level,
     .type = PORT_INPUT},
    {.name = "sysfs",
     .word = "sysfs",
     .kind = BACKEND_SYSFS,
     .furnish = &World::make_flag,
     .properties = &World::flag,
     .activate = &World::raise_flag,
     .type = PORT_INPUT},
    {.name = "null", .word = "null", .kind = BACKEND_NULL},
    {.name = "check", .word = "check", .kind = BACKEND_CHECK},
    {.name = "recipe",
     .word = "recipe",
     .kind = kToyKind,
     .furnish = &World::make_flag,
     .properties = &World::recipe_file,
     .activate = &World::raise_flag,
     .type = PORT_INPUT},
};

// Unsupervised at first: their plain pin is watched.
const std::vector<BackendUnderTest> kSupervisable = {
    {.name = "spi",
     .word = "spi",
     .kind = BACKEND_SPI,
     .furnish = &World::make_spidev,
     .properties = &World::supervised_spi,
     .activate = &World::raise_line,
     .supervisable = true},
    {.name = "iio",
     .word = "iio",
     .kind = BACKEND_IIO,
     .furnish = &World::make_buffered,
     .properties = &World::supervised_iio,
     .activate = &World::raise_line,
     .supervisable = true},
    {.name = "iio_interrupt",
     .word = "iio-interrupt",
     .kind = BACKEND_IIO_INTERRUPT,
     .furnish = &World::make_comparator,
     .properties = &World::supervised_interrupt,
     .activate = &World::raise_line,
     .supervisable = true,
     .drops = true},
    {.name = "iobox",
     .word = "iobox",
     .kind = BACKEND_IOBOX,
     .furnish = &World::make_box,
     .activate = &World::raise_box_state,
     .supervisable = true},
};

BackendUnderTest measured(BackendUnderTest row, const char *name, void (World::*activate)()) {
  row.name = name;
  row.measured = true;
  row.activate = activate;
  return row;
}

}  // namespace

// --- Hardware ---

World::World() {
  io_port_register_backend(kToyRow);
  fake_spidev() = {};
  fake_io_box() = {};
  set_spi_level(kRestingLevel);
}

void World::make_buffered() {
  make_buffered_converter();
  converter_.reset(open_node(2));
}

void World::make_comparator() {
  make_threshold_converter(6, "comparator");
  write(attribute(6, "in_voltage0_raw"), std::to_string(kRestingLevel) + "\n");
  converter_.reset(open_events(6));
}

void World::make_box() {
  fake_io_box().present = true;
}

void World::vanish() {
  for (const char *name : {"flag", "spidev", "class/gpio", "sys", "dev"}) {
    remove(name);
  }
  fake_io_box().present = false;
  converter_.reset();
}

std::vector<Property> World::lines() const {
  return {{"input", "pin", "1"}, {"output", "pin", "2"}, {"io_ctrl", "pin", "3"}};
}

std::vector<Property> World::flag() const {
  return {{"device", "path", path("flag")}, {"device", "timeout", "1"}};
}

std::vector<Property> World::recipe_file() const {
  return {{"file", "path", path("flag")}};
}

std::vector<Property> World::converter() const {
  return {{"device", "device", path("spidev")},
          {"device", "timeout", "1"},
          {"range", "name", "any"},
          {"input", "active_min", "100"},
          {"input", "active_max", "200"}};
}

std::vector<Property> World::supervised_spi() const {
  return join(join(pins(), {{"device", "path", path("spidev")}}), ranges());
}

std::vector<Property> World::supervised_iio() const {
  return join(join(pins(), {{"device", "name", "buffer"},
                            {"device", "adc", "adc"},
                            {"device", "hrtimer", "pulse"},
                            {"device", "freq", "12.50"},
                            {"device", "channel", "3"}}),
              ranges());
}

std::vector<Property> World::supervised_interrupt() const {
  return join(join(pins(), {{"device", "driver", "comparator"}}), ranges());
}

void World::raise_spi_level() {
  set_spi_level(kActiveLevel);
}

void World::raise_buffered_level() {
  const unsigned char sample[] = {kActiveLevel, 0};
  EXPECT_EQ(::write(converter_.get(), sample, sizeof sample), 2);
}

void World::raise_compared_level() {
  write(attribute(6, "in_voltage0_raw"), std::to_string(kActiveLevel) + "\n");
  const iio_event_data event{};  // of channel 0
  EXPECT_EQ(::write(converter_.get(), &event, sizeof event), static_cast<ssize_t>(sizeof event));
}

void World::raise_box_state() {
  io_box_signals(1, "closed");
}

// --- Backends ---

std::vector<BackendUnderTest> supervisable_backends() {
  std::vector<BackendUnderTest> rows = kSupervisable;
  rows.push_back(measured(kSupervisable[0], "spi_measured", &World::raise_spi_level));
  rows.push_back(measured(kSupervisable[1], "iio_measured", &World::raise_buffered_level));
  rows.push_back(
      measured(kSupervisable[2], "iio_interrupt_measured", &World::raise_compared_level));
  rows.push_back(measured(kSupervisable[3], "iobox_measured", &World::raise_box_state));
  return rows;
}

std::vector<BackendUnderTest> all_backends() {
  std::vector<BackendUnderTest> rows = kPlain;
  std::ranges::copy(supervisable_backends(), std::back_inserter(rows));
  return rows;
}

std::string name_of(const testing::TestParamInfo<BackendUnderTest> &backend) {
  return backend.param.name;
}

void PrintTo(const BackendUnderTest &backend,  // NOLINT(readability-identifier-naming)
             std::ostream *out) {
  *out << backend.name;
}

void PrintTo(const Held &held, std::ostream *out) {  // NOLINT(readability-identifier-naming)
  *out << held.sources << " sources, " << held.files << " files, " << held.io_box_proxies
       << " proxies, watched: " << testing::PrintToString(held.watched);
}

// --- Ports ---

BackendContract::BackendContract() {
  (this->*GetParam().furnish)();
  before_ = held();
}

void BackendContract::appear() {
  for (const int line : {1, 2, 3, 4}) {
    make_line(line);
  }
  (this->*GetParam().furnish)();
}

IOPortRef BackendContract::described() const {
  auto port = make_port(GetParam().kind, GetParam().type, (this->*GetParam().properties)());
  io_port_restore_supervised(port.get(), GetParam().measured);
  return port;
}

IOPortRef BackendContract::set_up() const {
  auto port = described();
  EXPECT_TRUE(io_port_setup(port.get()));
  return port;
}

IOPortRef BackendContract::watched() const {
  auto port = set_up();
  io_port_set_watch(port.get());
  return port;
}

// Returns when the box has answered everything, and the main loop has taken it.
void BackendContract::wait_until_box_idle() {
  const auto port = make_port(BACKEND_IOBOX, PORT_OUTPUT, {});
  io_port_set_number(port.get(), kSilentBoxPort);
  static_cast<IoBoxBackendData *>(io_port_backend_data(port.get()))->connected = true;
  port->functions->set_direction(port.get(), false);
  while (port->refcount > 1) {  // the job's is given back on the main loop
    iterate();
  }
}

Held BackendContract::held() const {
  if (GetParam().kind == BACKEND_IOBOX) {
    wait_until_box_idle();
  }
  return {.sources = sources(),
          .watched = watched_files(),
          .files = descriptors(),
          .io_box_proxies = io_box_proxies() > kSharedProxies ? io_box_proxies() : 0};
}

void BackendContract::expect_given_back() const {
  EXPECT_EQ(held(), before_);
}

Words BackendContract::reports_of_activation(const IOPortRef &port) {
  (void)io_port_get_state(port.get());
  expire_all();
  reports();  // a line that is measured for the first time is news
  if (GetParam().activate) {
    (this->*GetParam().activate)();
  }
  (void)io_port_get_state(port.get());
  iterate();
  expire_all();
  return reports();
}
