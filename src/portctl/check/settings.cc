#include "portctl/check/settings.h"

#include <algorithm>
#include <map>
#include <optional>
#include <utility>

#include "base/glib-ptr.h"
#include "portctl/check/values.h"

using vocabulary::Setting;
using vocabulary::Type;

namespace {

constexpr std::string_view kTriggerPrefix = "manualtrigger";
constexpr std::uint32_t kLevels = 65536;

struct Entry {
  std::string key;
  std::string text;  // as it stands
  Place place;
};

struct Group {
  std::string name;
  Place place;
  std::vector<Entry> entries;

  const Entry *find(std::string_view key) const {
    const auto found = std::find_if(entries.begin(), entries.end(),
                                    [&](const Entry &entry) { return entry.key == key; });
    return found == entries.end() ? nullptr : &*found;
  }
};

std::string trimmed(std::string_view text) {
  const auto begin = text.find_first_not_of(" \t\r");
  const auto end = text.find_last_not_of(" \t\r");
  return begin == std::string_view::npos ? "" : std::string(text.substr(begin, end - begin + 1));
}

// The file as groups with places. The daemon's own parser does not tell places, but has the last
// word on what is well formed.
class SettingsReader {
 public:
  SettingsReader(std::string file, Findings &findings)
      : file_(std::move(file)), findings_(findings) {}

  std::vector<Group> read(std::string_view text) {
    while (!text.empty()) {
      ++line_;
      const auto end = text.find('\n');
      take(text.substr(0, end));
      text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    }
    return std::move(groups_);
  }

 private:
  Place place(int column = 1) const { return {file_, line_, column}; }

  void take(std::string_view line) {
    const std::string content = trimmed(line);
    if (content.empty() || content.front() == '#') {
      return;
    }
    const auto equals = content.find('=');
    if (content.front() == '[' && content.back() == ']') {
      take_group(content.substr(1, content.size() - 2));
    } else if (equals != std::string::npos && equals > 0) {
      take_entry(
          {trimmed(content.substr(0, equals)), trimmed(content.substr(equals + 1)), place()});
    } else {
      findings_.error(place(),
                      "malformed: this is neither [a group] nor key=value nor # a remark; "
                      "the daemon does not start with such a file");
    }
  }

  void take_group(const std::string &name) {
    for (const auto &group : groups_) {
      if (group.name == name) {
        findings_.warning(place(), "the group " + quoted(name) + " begins in line " +
                                       std::to_string(group.place.line) +
                                       " already: both count as one, the later value wins");
      }
    }
    groups_.push_back({name, place(), {}});
  }

  void take_entry(Entry entry) {
    if (groups_.empty()) {
      findings_.error(entry.place,
                      "malformed: a key before any [group]; the daemon does not start "
                      "with such a file");
      return;
    }
    if (const Entry *other = groups_.back().find(entry.key)) {
      findings_.warning(entry.place, "the key " + quoted(entry.key) + " stands in line " +
                                         std::to_string(other->place.line) +
                                         " already: the later value wins");
    }
    groups_.back().entries.push_back(std::move(entry));
  }

  std::string file_;
  Findings &findings_;
  int line_ = 0;
  std::vector<Group> groups_;
};

bool can_be_supervised(const DescribedPort &port) {
  const bool backend = port.backend && (port.backend->supervised || port.backend->name == "iobox");
  const bool side = port.type != "output" || port.backend->name == "iobox";
  return backend && side && !port.always_measured;
}

bool applies(const Setting &setting, const DescribedPort &port) {
  return setting.port_types.empty() ? can_be_supervised(port)
                                    : vocabulary::holds_word(setting.port_types, port.type);
}

// Values are read by the parser that the daemon uses.
class ValueChecker {
 public:
  ValueChecker(const Group &group, const Entry &entry, const Setting &setting)
      : group_(group), entry_(entry), setting_(setting), file_(g_key_file_new()) {}

  std::optional<std::string> mistake() {
    const std::string text = "[" + group_.name + "]\n" + entry_.key + "=" + entry_.text + "\n";
    Error error;
    if (!g_key_file_load_from_data(file_.get(), text.c_str(), text.size(), G_KEY_FILE_NONE,
                                   error.out())) {
      return std::string(error.message());
    }
    if (setting_.type == Type::kSwitch) {
      g_key_file_get_boolean(file_.get(), group(), key(), error.out());
      return error ? std::optional(quoted(entry_.text) + " is no switch: write true or false")
                   : std::nullopt;
    }
    if (setting_.type == Type::kUnsigned) {
      g_key_file_get_uint64(file_.get(), group(), key(), error.out());
      return error ? std::optional(quoted(entry_.text) + " is no number: write one from 0 on")
                   : std::nullopt;
    }
    const GCharPtr value(g_key_file_get_string(file_.get(), group(), key(), error.out()));
    // A text with a bad escape comes together with an error.
    if (error) {
      return std::string(error.message()) + ": write \\\\ for a backslash";
    }
    return setting_.key == "supervised_input_ranges" ? ranges_mistake(value.get())
                                                     : word_mistake(value.get());
  }

 private:
  const char *group() const { return group_.name.c_str(); }
  const char *key() const { return entry_.key.c_str(); }

  std::optional<std::string> word_mistake(const std::string &value) const {
    if (setting_.type != Type::kWord) {
      return std::nullopt;
    }
    const vocabulary::Attribute word = {
        .name = setting_.key, .type = Type::kWord, .words = setting_.words};
    return value_mistake(word, value);
  }

  static std::optional<std::string> ranges_mistake(const char *text) {
    Error error;
    const GVariantPtr ranges(
        g_variant_parse(G_VARIANT_TYPE("a(suu)"), text, nullptr, nullptr, error.out()));
    if (!ranges) {
      return std::string("no ranges: ") + error.message() +
             "; write them such as [('open', uint32 100, uint32 200)]";
    }
    for (gsize i = 0; i < g_variant_n_children(ranges.get()); ++i) {
      const char *state = nullptr;
      guint32 lower = 0;
      guint32 upper = 0;
      g_variant_get_child(ranges.get(), i, "(&suu)", &state, &lower, &upper);
      if (!vocabulary::holds_word("open closed short cut", state)) {
        return quoted(state) + " is no state: write open, closed, short or cut";
      }
      if (lower >= upper || upper >= kLevels) {
        return "the range of " + quoted(state) + " needs lower < upper < 65536";
      }
    }
    return std::nullopt;
  }

  const Group &group_;
  const Entry &entry_;
  const Setting &setting_;
  GKeyFilePtr file_;
};

std::vector<std::string_view> setting_names(const DescribedPort &port) {
  std::vector<std::string_view> names;
  for (const auto &setting : vocabulary::settings()) {
    if (applies(setting, port)) {
      names.push_back(setting.key);
    }
  }
  return names;
}

const Setting *find_setting(std::string_view key) {
  for (const auto &setting : vocabulary::settings()) {
    if (setting.key == key) {
      return &setting;
    }
  }
  return nullptr;
}

void check_entry(const Group &group, const Entry &entry, const DescribedPort &port,
                 Findings &findings) {
  const Setting *setting = find_setting(entry.key);
  if (!setting) {
    findings.error(entry.place, "no setting is called " + quoted(entry.key) + ", it is ignored" +
                                    suggestion(entry.key, setting_names(port)));
    return;
  }
  if (!applies(*setting, port)) {
    findings.warning(entry.place, entry.key + " has no effect on the port " + quoted(group.name) +
                                      ", it is ignored");
    return;
  }
  if (const auto mistake = ValueChecker(group, entry, *setting).mistake()) {
    findings.error({entry.place.file, entry.place.line, static_cast<int>(entry.key.size()) + 2},
                   entry.key + ": " + *mistake);
  }
}

// The daemon reads the keys in the order of the vocabulary and stops at the first that is missing.
void check_missing(const Group &group, const DescribedPort &port, Findings &findings) {
  for (const auto &setting : vocabulary::settings()) {
    if (applies(setting, port) && !group.find(setting.key)) {
      findings.error(group.place, "the group " + quoted(group.name) + " lacks " +
                                      std::string(setting.key) +
                                      ": the daemon reads no further in it");
      return;
    }
  }
}

void check_group(const Group &group, const std::vector<DescribedPort> &ports, Findings &findings) {
  std::vector<std::string_view> names;
  for (const auto &port : ports) {
    names.push_back(port.id);
    if (port.id != group.name) {
      continue;
    }
    for (const auto &entry : group.entries) {
      check_entry(group, entry, port, findings);
    }
    check_missing(group, port, findings);
    return;
  }
  if (!group.name.starts_with(kTriggerPrefix)) {
    findings.warning(group.place, "no port is called " + quoted(group.name) +
                                      ", the group is kept but has no effect" +
                                      suggestion(group.name, names));
  }
}

}  // namespace

void check_settings(const std::string &file, const std::string &text,
                    const std::vector<DescribedPort> &ports, Findings &findings) {
  for (const auto &group : SettingsReader(file, findings).read(text)) {
    check_group(group, ports, findings);
  }
}
