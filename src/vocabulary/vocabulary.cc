#include "vocabulary/vocabulary.h"

namespace vocabulary {

namespace {

constexpr Attribute kPort[] = {
    {.name = "hwid",
     .fallback = "every device",
     .effect = "The port exists only where the hardware id begins with one of these texts, which "
               "colons separate. Must stand first."},
    {.name = "name",
     .effect = "The port's identifier: clients see it, its settings are stored under it, and a "
               "later port of the same identifier replaces it. Must stand first, or right after "
               "hwid.",
     .required = true},
    {.name = "optional",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "A port whose hardware is missing is taken out of service until a refresh finds "
               "it, and clients may take it out of service themselves."},
};
constexpr Attribute kPortType[] = {
    {.name = "type",
     .type = Type::kWord,
     .effect = "input, output, or io_ctrl: either of them, as the user chooses; an input at "
               "first.",
     .words = "input output io_ctrl",
     .required = true},
};
constexpr Attribute kPortNo[] = {
    {.name = "nbr",
     .type = Type::kUnsigned,
     .effect = "The port's number. Ports are numbered from 0 without holes: names by default and "
               "the saving of all settings at start-up end at the number of ports.",
     .required = true},
};
constexpr Attribute kParamDefaultName[] = {
    {.name = "input",
     .fallback = "Input and a counter",
     .effect = "Name of the input side until the user gives another."},
    {.name = "output",
     .fallback = "Output and a counter",
     .effect = "Name of the output side until the user gives another."},
};
constexpr Attribute kBackend[] = {
    {.name = "name",
     .type = Type::kWord,
     .effect = "Which hardware is behind the port. The elements inside say where it is.",
     .words = "gpio spiadc spi iio iio-interrupt sysfs virtual iobox null check",
     .required = true},
};
constexpr Attribute kEvent[] = {
    {.name = "declaration",
     .effect = "IOPort, PortAny, com.kelv.Event.Pcd.SupervisedPort, or a type that the event "
               "system knows.",
     .required = true},
    {.name = "input",
     .type = Type::kSwitch,
     .fallback = "true",
     .effect = "Sent while the port is an input."},
    {.name = "output",
     .type = Type::kSwitch,
     .fallback = "true",
     .effect = "Sent while the port is an output."},
    {.name = "supervised_input",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "Sent while the port is a supervised input, and then once for each state of the "
               "line."},
    {.name = "declare_only",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "Declared, but never sent."},
};
constexpr Attribute kKeyvalue[] = {
    {.name = "key", .effect = "Name of the key in the event.", .required = true},
    {.name = "value",
     .fallback = "empty",
     .effect = "The value, or PORT_STATUS, PORT_ACTIVE or PORT_SUPERVISED_STATUS for what the "
               "port has at that time."},
    {.name = "type",
     .type = Type::kWord,
     .effect = "Type of the key.",
     .words = "int bool string double",
     .required = true},
    {.name = "key-nice-name",
     .fallback = "none",
     .effect = "The key's name for people; PORT_NAME stands for the port's name."},
    {.name = "value-nice-name",
     .fallback = "none",
     .effect = "The value's name for people; PORT_NAME stands for the port's name."},
    {.name = "property",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "The key is the one that changes: it is sent with every event."},
};
constexpr Attribute kFirstVirtualInput[] = {
    {.name = "nbr",
     .type = Type::kUnsigned,
     .effect = "Number of the first manual trigger: that of video channel n gets this number plus "
               "n minus 1. Ports below it are offered to older configuration tools; without it "
               "those below 5 are, and there are no manual triggers.",
     .required = true},
};

constexpr Element kElements[] = {
    {"port", kPort, "One port of the device. The elements that follow inside belong to it."},
    {"port_type", kPortType, "What the port is."},
    {"port_no", kPortNo, "How clients call it."},
    {"properties",
     {},
     "Flags of the port: the attribute is the flag, true in any letter case sets it.",
     true},
    {"param_default_name", kParamDefaultName, "Names before the user gives any."},
    {"backend", kBackend, "The hardware."},
    {"event", kEvent, "An event that a change of the port raises."},
    {"keyvalue", kKeyvalue, "A key of the event around it, where the event is not built in."},
    {"first_virtual_input", kFirstVirtualInput, "Where manual triggers begin. Once a device."},
};

constexpr Attribute kFlags[] = {
    {.name = "ioport",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "One of the device's own ports: clients can read and control it. A port without it "
               "is listed, and that is all."},
    {.name = "virtual",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "Has no hardware: clients set its state."},
    {.name = "hidden",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "User interfaces should leave it out."},
    {.name = "video_connector",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "Senses the plug of a video connector."},
    {.name = "audio_connector",
     .type = Type::kSwitch,
     .fallback = "false",
     .effect = "Senses the plug of an audio connector."},
};

// --- Sections of backends ---

constexpr Attribute kPin[] = {
    {.name = "pin",
     .type = Type::kUnsigned,
     .fallback = "0",
     .effect = "The line by its number in sysfs. Numbers may change with the kernel: prefer "
               "alias."},
    {.name = "alias", .fallback = "none", .effect = "The line by its name. Goes before pin."},
    {.name = "inverted",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "The line is active low."},
};
constexpr Attribute kRange[] = {
    {.name = "state",
     .type = Type::kWord,
     .effect = "The state of the line that these levels mean.",
     .words = "open closed short cut",
     .required = true},
    {.name = "lower",
     .type = Type::kUnsigned,
     .effect = "Lowest level of the range.",
     .required = true},
    {.name = "upper",
     .type = Type::kUnsigned,
     .effect = "Highest level, above lower and below 65536. The three stand in this order: upper "
               "completes the range.",
     .required = true},
};

constexpr Element kGpioSections[] = {
    {"input", kPin, "The line that is read."},
    {"output", kPin, "The line that is driven."},
    {"io_ctrl", kPin, "The line that switches between the two; high for an output."},
};
constexpr Need kGpioNeeds[] = {
    {"input", "input"},    {"output", "output"},   {"io_ctrl", "input"},
    {"io_ctrl", "output"}, {"io_ctrl", "io_ctrl"},
};

constexpr Attribute kSysfsDevice[] = {
    {.name = "path", .effect = "The file, which holds 0 or 1.", .required = true},
    {.name = "timeout",
     .type = Type::kAnyBase,
     .effect = "Milliseconds between two looks. Without it the daemon looks all the time.",
     .required = true},
    {.name = "clear_flag",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "The file is a latched flag: 0 is written back after a 1 was read."},
    {.name = "inverted",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "0 in the file means active."},
};
constexpr Element kSysfsSections[] = {{"device", kSysfsDevice, "The attribute file."}};
constexpr Need kNeedsDevice[] = {{"", "device"}};

constexpr Attribute kSpiadcDevice[] = {
    {.name = "device", .effect = "Device node of the converter.", .required = true},
    {.name = "address",
     .type = Type::kAnyBase,
     .fallback = "0",
     .effect = "Byte that starts a conversion."},
    {.name = "timeout",
     .type = Type::kAnyBase,
     .effect = "Milliseconds between two samples. Without it the daemon samples all the time.",
     .required = true},
    {.name = "inverted",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "The input is active outside of all ranges."},
};
constexpr Attribute kSpiadcRange[] = {
    {.name = "nbr",
     .effect = "Any attribute begins a new range; its name and value mean nothing. Write one, and "
               "one only: each begins a range.",
     .required = true},
};
constexpr Attribute kSpiadcInput[] = {
    {.name = "active_min",
     .type = Type::kAnyBase,
     .fallback = "0",
     .effect = "Lowest sample of the range begun last, 0 to 4095."},
    {.name = "active_max",
     .type = Type::kAnyBase,
     .fallback = "0",
     .effect = "Highest sample of the range begun last."},
    {.name = "hysteresis",
     .type = Type::kAnyBase,
     .fallback = "0",
     .effect = "The range is that much wider while the input is active, narrower while it is "
               "not."},
};
constexpr Element kSpiadcSections[] = {
    {"device", kSpiadcDevice, "The converter."},
    {"range", kSpiadcRange, "Begins a range of samples."},
    {"input", kSpiadcInput, "The limits of the range begun last."},
};
constexpr Need kSpiadcNeeds[] = {{"", "device"}, {"", "range"}, {"", "input"}};

constexpr Attribute kSpiDevice[] = {
    {.name = "path", .effect = "Device node of the converter.", .required = true}};
constexpr Attribute kSpiAddress[] = {{.name = "value",
                                      .type = Type::kHexadecimal,
                                      .fallback = "0",
                                      .effect = "Byte that selects what the converter measures."}};
constexpr Attribute kSpiSpeed[] = {{.name = "value",
                                    .type = Type::kAnyBase,
                                    .fallback = "the device's own",
                                    .effect = "Highest clock of the bus in hertz."}};

constexpr std::string_view kInputLine = "The line that is read while supervision is off.";
constexpr std::string_view kOutputLine = "The line that is driven while the port is an output.";
constexpr std::string_view kIoCtrl = "The line that switches the plain path on.";
constexpr std::string_view kSioCtrl = "The line that switches the measured path on.";
constexpr std::string_view kRangeEffect = "The levels of one state of the line.";

constexpr Element kSpiSections[] = {
    {"device", kSpiDevice, "The converter."},
    {"address", kSpiAddress, "Its channel."},
    {"speed", kSpiSpeed, "The clock of the bus."},
    {"input", kPin, kInputLine},
    {"output", kPin, kOutputLine},
    {"io_ctrl", kPin, kIoCtrl},
    {"sio_ctrl", kPin, kSioCtrl},
    {"range", kRange, kRangeEffect},
};
// An output is not measured.
constexpr Need kSupervisedNeeds[] = {
    {"input", "input"},   {"io_ctrl", "input"},   {"output", "output"},  {"io_ctrl", "output"},
    {"input", "io_ctrl"}, {"io_ctrl", "io_ctrl"}, {"input", "sio_ctrl"}, {"io_ctrl", "sio_ctrl"},
    {"input", "device"},  {"io_ctrl", "device"},
};
// The measured path may be always on.
constexpr Need kInterruptNeeds[] = {
    {"input", "input"},     {"io_ctrl", "input"}, {"io_ctrl", "output"}, {"input", "io_ctrl"},
    {"io_ctrl", "io_ctrl"}, {"input", "device"},  {"io_ctrl", "device"},
};

constexpr Attribute kIioDevice[] = {
    {.name = "name", .effect = "Name of the device whose buffer is read.", .required = true},
    {.name = "adc", .effect = "Name of the device whose trigger is set.", .required = true},
    {.name = "hrtimer", .effect = "Name of the timer trigger.", .required = true},
    {.name = "freq", .effect = "Samples per second.", .required = true},
    {.name = "shift",
     .type = Type::kUnsigned,
     .fallback = "0",
     .effect = "Bits by which a sample is shifted right."},
    {.name = "channel", .type = Type::kUnsigned, .fallback = "0", .effect = "The channel."},
};
constexpr Element kIioSections[] = {
    {"device", kIioDevice, "The converter."},
    {"input", kPin, kInputLine},
    {"output", kPin, kOutputLine},
    {"io_ctrl", kPin, kIoCtrl},
    {"sio_ctrl", kPin, kSioCtrl},
    {"range", kRange, kRangeEffect},
};

constexpr Attribute kInterruptDevice[] = {
    {.name = "mode",
     .type = Type::kWord,
     .fallback = "plain",
     .effect = "adc: the port is always measured, can't be switched over D-Bus, and keeps its "
               "ranges to itself. Must stand before the ranges.",
     .words = "adc"},
    {.name = "driver", .effect = "Name of the device.", .required = true},
    {.name = "channel", .type = Type::kUnsigned, .fallback = "0", .effect = "The channel."},
    {.name = "channel_name",
     .fallback = "voltage and the channel",
     .effect = "The channel's name in the attribute files."},
    {.name = "chan_extend_name",
     .fallback = "none",
     .effect = "What follows the channel's name in the attribute files."},
    {.name = "hysteresis",
     .type = Type::kUnsigned,
     .fallback = "0",
     .effect = "Levels by which thresholds lie outside of the range."},
    {.name = "lower_limit",
     .type = Type::kNumber,
     .fallback = "none",
     .effect = "At this level and below, thresholds do not work: the level is polled."},
    {.name = "upper_limit",
     .type = Type::kNumber,
     .fallback = "none",
     .effect = "At this level and above, thresholds do not work: the level is polled."},
    {.name = "limit_timeout",
     .type = Type::kUnsigned,
     .fallback = "1000",
     .effect = "Milliseconds between two looks beyond a limit."},
    {.name = "bitshift",
     .type = Type::kNumber,
     .fallback = "0",
     .effect = "Bits by which a raw value is shifted right."},
    {.name = "integration_time",
     .type = Type::kNumber,
     .fallback = "0",
     .effect = "Microseconds; above 0 it is set on the device."},
    {.name = "one_threshold",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "The device has only one threshold at a time."},
    {.name = "shared_samplefreq",
     .fallback = "as it is",
     .effect = "Samples per second of the whole device."},
    {.name = "shared_thresh_either_period",
     .fallback = "as it is",
     .effect = "How long a level must lie beyond a threshold."},
    {.name = "cache_ad_value",
     .type = Type::kStrictSwitch,
     .fallback = "true",
     .effect = "Clients that ask get the last value; false measures for each of them."},
    {.name = "pullup_when_supervised",
     .type = Type::kStrictSwitch,
     .fallback = "false",
     .effect = "io_ctrl stays on while the port is supervised."},
};
constexpr Element kInterruptSections[] = {
    {"device", kInterruptDevice, "The converter."},
    {"input", kPin, kInputLine},
    {"output", kPin, kOutputLine},
    {"io_ctrl", kPin, kIoCtrl},
    {"sio_ctrl", kPin, kSioCtrl},
    {"range", kRange, kRangeEffect},
};

constexpr std::string_view kInputTypes = "input";
constexpr std::string_view kAllTypes = "input output io_ctrl";

constexpr Backend kBackends[] = {
    {.name = "gpio",
     .port_types = kAllTypes,
     .effect = "A line of a GPIO chip.",
     .sections = kGpioSections,
     .needs = kGpioNeeds,
     .example = R"(<backend name="gpio">
  <output alias="relay1" inverted="true"/>
</backend>)"},
    {.name = "sysfs",
     .port_types = kInputTypes,
     .effect = "An attribute file that holds 0 or 1 and is polled.",
     .sections = kSysfsSections,
     .needs = kNeedsDevice,
     .example = R"(<backend name="sysfs">
  <device path="/sys/class/leds/fault/brightness" timeout="500"/>
</backend>)"},
    {.name = "spiadc",
     .port_types = kInputTypes,
     .effect = "A converter on an SPI bus, active while the sample lies in a range.",
     .sections = kSpiadcSections,
     .needs = kSpiadcNeeds,
     .example = R"(<backend name="spiadc">
  <device device="/dev/spidev0.0" address="0x98" timeout="100"/>
  <range nbr="1"/>
  <input active_min="1000" active_max="2000" hysteresis="50"/>
</backend>)"},
    {.name = "spi",
     .port_types = kAllTypes,
     .effect = "A supervised input on a converter of an SPI bus.",
     .sections = kSpiSections,
     .needs = kSupervisedNeeds,
     .example = R"(<backend name="spi">
  <device path="/dev/spidev0.0"/>
  <address value="98"/>
  <input alias="in1"/>
  <io_ctrl alias="in1-plain"/>
  <sio_ctrl alias="in1-measure"/>
  <range state="closed" lower="800" upper="1599"/>
  <range state="open" lower="1600" upper="2799"/>
  <range state="short" lower="0" upper="799"/>
  <range state="cut" lower="2800" upper="4095"/>
</backend>)",
     .supervised = true},
    {.name = "iio",
     .port_types = kAllTypes,
     .effect = "A supervised input on an Industrial I/O device that samples into its buffer.",
     .sections = kIioSections,
     .needs = kSupervisedNeeds,
     .example = R"(<backend name="iio">
  <device name="adc0" adc="adc0" hrtimer="portd" freq="10" channel="2"/>
  <input alias="in1"/>
  <io_ctrl alias="in1-plain"/>
  <sio_ctrl alias="in1-measure"/>
  <range state="closed" lower="800" upper="1599"/>
  <range state="open" lower="1600" upper="2799"/>
</backend>)",
     .supervised = true},
    {.name = "iio-interrupt",
     .port_types = "input io_ctrl",
     .effect = "A supervised input on an Industrial I/O device with threshold events.",
     .sections = kInterruptSections,
     .needs = kInterruptNeeds,
     .example = R"(<backend name="iio-interrupt">
  <device driver="adc1" channel="3" hysteresis="5"/>
  <input alias="in1"/>
  <io_ctrl alias="in1-plain"/>
  <range state="closed" lower="800" upper="1599"/>
  <range state="open" lower="1600" upper="2799"/>
</backend>)",
     .supervised = true},
    {.name = "iobox",
     .port_types = kAllTypes,
     .effect = "A port of an external I/O box. Its number is that on the box. The box judges the "
               "line itself.",
     .sections = {},
     .needs = {},
     .example = R"(<backend name="iobox"/>)"},
    {.name = "virtual",
     .port_types = kAllTypes,
     .effect = "A state in memory that clients set.",
     .sections = {},
     .needs = {},
     .example = R"(<backend name="virtual"/>)"},
    {.name = "null",
     .port_types = kAllTypes,
     .effect = "A port that is never active and takes every command: not fitted in this model.",
     .sections = {},
     .needs = {},
     .example = R"(<backend name="null"/>)"},
    {.name = "check",
     .port_types = kAllTypes,
     .effect = "A port for trials: takes what it is told, and fails its set-up where any key "
               "\"setup\" is \"fail\".",
     .sections = {},
     .needs = {},
     .example = R"(<backend name="check"/>)",
     .any_section = true},
};

constexpr Setting kSettings[] = {
    {"input", Type::kSwitch, "io_ctrl", "true", "The port works as an input."},
    {"input_name", Type::kText, "input io_ctrl", "the description's", "Name of the input side."},
    {"input_activelow", Type::kSwitch, "input io_ctrl", "false",
     "A low level of the input is the active one."},
    {"output_name", Type::kText, "output io_ctrl", "the description's", "Name of the output side."},
    {"output_activelow", Type::kSwitch, "output io_ctrl", "false",
     "A low level of the output is the active one."},
    {"button_type", Type::kWord, "output io_ctrl", "none",
     "How older tools show the port. Any other word ends the reading of the group.",
     "none pulse actinact"},
    {"pulse_time", Type::kUnsigned, "output io_ctrl", "0", "Kept for older tools."},
    {"port_mode", Type::kWord, "output io_ctrl", "bistable",
     "Kept for older tools. Any other word counts as monostable.", "monostable bistable"},
    {"delay_time", Type::kUnsigned, "output io_ctrl", "0", "Kept for older tools."},
    {"supervised_input_ranges", Type::kText, "", "the description's",
     "The ranges of a measured line, as a GVariant text of the type a(suu): state, lower, upper."},
    {"supervised_input", Type::kSwitch, "", "false", "Supervision is on."},
};

constexpr std::string_view kBuiltInEvents[] = {"IOPort", "PortAny",
                                               "com.kelv.Event.Pcd.SupervisedPort"};

}  // namespace

std::span<const Element> elements() {
  return kElements;
}

std::span<const Backend> backends() {
  return kBackends;
}

std::span<const Setting> settings() {
  return kSettings;
}

std::span<const Attribute> flags() {
  return kFlags;
}

std::span<const std::string_view> built_in_events() {
  return kBuiltInEvents;
}

std::string_view type_in_words(Type type) {
  switch (type) {
    case Type::kText:
      return "text";
    case Type::kWord:
      return "word";
    case Type::kSwitch:
      return "true or false, in any letter case";
    case Type::kStrictSwitch:
      return "true or false";
    case Type::kNumber:
      return "decimal number";
    case Type::kUnsigned:
      return "decimal number from 0 on";
    case Type::kAnyBase:
      return "number: decimal, 0x and hexadecimal, or 0 and octal";
    case Type::kHexadecimal:
      return "hexadecimal number";
  }
  return "";
}

}  // namespace vocabulary
