#include "legacy/documents.h"

#include <array>
#include <span>

#include "legacy/names.h"

namespace {

constexpr const char *kReadOnly = "operator:1;admin:1;viewer:1";
constexpr const char *kReadWrite = "operator:3;admin:3;viewer:1";

// How an option of a parameter is laid out.
enum class Layout { kOneLine, kOneLineTight, kTwoLines };

struct Option {
  const char *name;
  const char *value;
  Layout layout;
};

struct Parameter {
  const char *name;
  const char *interface;
  const char *type;  // what the type element holds, up to its slash
  const char *legacy_type;
  Layout layout;  // of the legacy type
  const char *access;
  std::span<const Option> further = {};
  const char *indent = "    ";
};

constexpr const char *kWideIndent = "     ";

constexpr std::array<Option, 3> kTrigOptions = {{
    {"nicename", "Generate when circuit is...", Layout::kTwoLines},
    {"daemon", "pcd", Layout::kOneLine},
    {"signal", "1", Layout::kOneLine},
}};

constexpr Parameter kNbrOfInputs = {"NbrOfInputs",    kLegacyService,
                                    R"(type="int")",  "readonly:int:maxlen=3,min=0,max=100",
                                    Layout::kOneLine, kReadOnly};
constexpr Parameter kNbrOfOutputs = {"NbrOfOutputs",   kLegacyService,
                                     R"(type="int")",  "readonly:int:maxlen=3,min=0,max=100",
                                     Layout::kOneLine, kReadOnly};

constexpr Parameter kConfigurable = {
    "Configurable",    kLegacyService,   R"(type="bool" truevalue="yes" falsevalue="no" )",
    "readonly:yes_no", Layout::kOneLine, kReadOnly};
constexpr Parameter kDirection = {"Direction",        kLegacyService,
                                  R"(type="string")", "enum:input|Input, output|Output",
                                  Layout::kOneLine,   kReadWrite};
constexpr Parameter kFixedDirection = {
    "Direction",        kLegacyService,
    R"(type="string")", "readonly:enum:input|Input, output|Output",
    Layout::kOneLine,   kReadWrite};

constexpr std::array<Parameter, 2> kPortParameters = {kConfigurable, kDirection};
constexpr std::array<Parameter, 2> kFixedPortParameters = {kConfigurable, kFixedDirection};

constexpr std::array<Parameter, 2> kInputParameters = {{
    {"Name", kLegacyInputInterface, R"(type="string" )", "string", Layout::kOneLineTight,
     kReadWrite},
    {"Trig", kLegacyInputInterface, R"(type="string" )", "enum:closed|Closed, open|Open",
     Layout::kOneLine, kReadWrite, kTrigOptions},
}};

constexpr std::array<Parameter, 6> kOutputParameters = {{
    {"DelayTime", kLegacyOutputInterface, R"(type="int" )", "int", Layout::kOneLine, kReadWrite},
    {"Mode",
     kLegacyOutputInterface,
     R"(type="string" )",
     "enum:bistable|Bistable, monostable|Monostable",
     Layout::kTwoLines,
     kReadWrite,
     {},
     kWideIndent},
    {"Name",
     kLegacyOutputInterface,
     R"(type="string" )",
     "string",
     Layout::kOneLineTight,
     kReadWrite,
     {},
     kWideIndent},
    {"Active", kLegacyOutputInterface, R"(type="string" )", "enum:closed|Closed, open|Open",
     Layout::kOneLine, kReadWrite},
    {"Button", kLegacyOutputInterface, R"(type="string" )",
     "enum: none|None, pulse|Pulse, actinact|Active/Inactive", Layout::kTwoLines, kReadWrite},
    {"PulseTime", kLegacyOutputInterface, R"(type="int" )", "int", Layout::kOneLine, kReadWrite},
}};

template <typename... Pieces>
void append(std::string &text, const Pieces &...pieces) {
  (text.append(pieces), ...);
}

void append_option(std::string &text, const Option &option) {
  const char *between = option.layout == Layout::kTwoLines ? "\n                      " : " ";
  const char *end = option.layout == Layout::kOneLineTight ? "/>\n" : " />\n";
  append(text, "        <legacyoption name=\"", option.name, "\"", between, "value=\"",
         option.value, "\"", end);
}

void append_parameter(std::string &text, const Parameter &parameter, int port) {
  append(text, parameter.indent, "<parameter name=\"", parameter.name, "\">\n");
  append(text, "      <property dbus=\"", kLegacyService, "\"\n");
  append(text, "                object=\"", legacy_object_path(port), "\"\n");
  append(text, "                interface=\"", parameter.interface, "\"\n");
  append(text, "                name=\"", parameter.name, "\">\n");
  append(text, "        <type ", parameter.type, "/>\n");
  append(text, "      </property>\n");
  append(text, "      <legacyoptions>\n");
  append_option(text, {"type", parameter.legacy_type, parameter.layout});
  append_option(text, {"accessControl", parameter.access, Layout::kTwoLines});
  for (const auto &option : parameter.further) {
    append_option(text, option);
  }
  append(text, "      </legacyoptions>\n");
  append(text, "    </parameter>\n");
}

void append_group(std::string &text, const std::string &name, std::span<const Parameter> parameters,
                  int port) {
  append(text, "  <group name=\"", name, "\">\n");
  for (const auto &parameter : parameters) {
    append_parameter(text, parameter, port);
  }
  append(text, "  </group>\n");
}

std::string port_group(const LegacyPort &port) {
  return "root.IOPort.I" + std::to_string(port.number);
}

void append_object(std::string &text, int port) {
  append(text, "    <object name=\"", legacy_object_path(port), "\">\n");
  append(text, "      <interfaces>\n");
  for (const char *interface : {kLegacyService, kLegacyInputInterface, kLegacyOutputInterface}) {
    append(text, "        <interface name=\"", interface,
           "\" emitspropertieschanged=\"true\" />\n");
  }
  append(text, "      </interfaces>\n");
  append(text, "    </object>\n");
}

}  // namespace

std::string legacy_registry_document(const std::vector<LegacyPort> &ports) {
  std::string text = "<?xml version=\"1.0\" encoding=\"UTF-8\" ?>\n";
  append(text, "<service name=\"", kLegacyService, "\">\n", "  <objects>\n");
  for (const auto &port : ports) {
    append_object(text, port.number);
  }
  if (ports.empty()) {
    append_object(text, 0);
  }
  append(text, "  </objects>\n", "</service>\n");
  return text;
}

std::string legacy_mapping_document(const std::vector<LegacyPort> &ports) {
  std::string text = "<mapping>\n";
  append_group(text, "root.Input", {&kNbrOfInputs, 1}, 0);
  append_group(text, "root.Output", {&kNbrOfOutputs, 1}, 0);
  for (const auto &port : ports) {
    append_group(text, port_group(port),
                 port.type == PORT_CONFIGURABLE ? kPortParameters : kFixedPortParameters,
                 port.number);
  }
  for (const auto &port : ports) {
    if (port.type != PORT_OUTPUT) {
      append_group(text, port_group(port) + ".Input", kInputParameters, port.number);
    }
  }
  for (const auto &port : ports) {
    if (port.type != PORT_INPUT) {
      append_group(text, port_group(port) + ".Output", kOutputParameters, port.number);
    }
  }
  text += "</mapping>\n";
  return text;
}
