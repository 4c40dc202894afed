// portctl: the daemon's ports from a command line.
#include <getopt.h>
#include <unistd.h>

#include <charconv>
#include <clocale>
#include <cmath>
#include <cstdio>
#include <cstring>

#include "portctl/ports.h"
#include "portctl/session.h"
#include "portctl/text.h"

namespace {

constexpr int kMaxRepeat = 65536;

// The letters are what Command::options names; only -h, -j and -a can be typed as such.
constexpr option kOptions[] = {
    {"help", no_argument, nullptr, 'h'},
    {"version", no_argument, nullptr, 'V'},
    {"address", required_argument, nullptr, 'a'},
    {"json", no_argument, nullptr, 'j'},
    {"timeout", required_argument, nullptr, 't'},
    {"repeat", required_argument, nullptr, 'r'},
    {"input", no_argument, nullptr, 'i'},
    {"output", no_argument, nullptr, 'o'},
    {"wait", no_argument, nullptr, 'w'},
    {"virtual", no_argument, nullptr, 'v'},
    {"settings", required_argument, nullptr, 's'},
    {"strict", no_argument, nullptr, 'S'},
    {"notes", required_argument, nullptr, 'n'},
    {"title", required_argument, nullptr, 'T'},
    {nullptr, 0, nullptr, 0},
};

constexpr const char *kEverywhere = "hVa";

constexpr const char *kExplanation =
    "PORT: number, identifier or name. Everywhere: -a, --address BUS, -j, --json, -h.\n"
    "Exit: 0 done, 1 refused, 2 usage, 3 no such port, 4 not allowed, 5 no daemon, 6\n"
    "timed out. \"portctl COMMAND --help\" tells more of each, portctl(1) all.";

void print_overview() {
  std::puts("Usage: portctl COMMAND [OPTION...] [ARGUMENT...]");
  for (const auto &command : commands()) {
    if (*command.summary) {
      std::printf("  %-11s%s\n", command.name, command.summary);
    }
  }
  std::puts(kExplanation);
}

void print_help(const Command &command) {
  std::printf("Usage: portctl %s%s%s\n%s\n", command.name, *command.usage ? " " : "", command.usage,
              command.summary);
  if (*command.help) {
    std::printf("\n%s\n", command.help);
  }
}

[[noreturn]] void fail_usage(const std::string &message) {
  fail(STATUS_USAGE, message + ": see \"portctl --help\"");
}

double parse_seconds(const char *text) {
  double seconds = 0;
  const char *end = text + std::strlen(text);
  const auto [rest, error] = std::from_chars(text, end, seconds);
  if (error != std::errc() || rest != end || !std::isfinite(seconds) || seconds < 0) {
    fail_usage("--timeout takes a number of seconds");
  }
  return seconds;
}

int parse_repeat(const char *text) {
  const auto count = parse_number(text);
  if (!count || *count < 1 || *count > kMaxRepeat) {
    fail_usage("--repeat takes a number from 1 to 65536");
  }
  return static_cast<int>(*count);
}

void apply_option(Options &options, int letter) {
  switch (letter) {
    case 'h':
      options.help = true;
      break;
    case 'V':
      std::puts("portctl " PORTCTL_VERSION);
      std::exit(STATUS_OK);
    case 'a':
      options.address = optarg;
      break;
    case 'j':
      options.json = true;
      break;
    case 't':
      options.timeout = parse_seconds(optarg);
      break;
    case 'r':
      options.repeat = parse_repeat(optarg);
      break;
    case 'i':
    case 'o':
      options.input_side = letter == 'i';
      break;
    case 'w':
      options.wait = true;
      break;
    case 'v':
      options.reported = true;
      break;
    case 's':
      options.settings = optarg;
      break;
    case 'S':
      options.strict = true;
      break;
    case 'n':
      options.notes = optarg;
      break;
    case 'T':
      options.title = optarg;
      break;
    default:
      fail_usage("unknown option, or one without its value");
  }
}

const Command *find_command(const std::string &name) {
  for (const auto &command : commands()) {
    if (name == command.name) {
      return &command;
    }
  }
  return nullptr;
}

const char *long_name(int letter) {
  for (const auto *entry = kOptions; entry->name; ++entry) {
    if (entry->val == letter) {
      return entry->name;
    }
  }
  return "";
}

void check_fits(const Command &command, const std::string &letters, std::size_t words) {
  for (const char letter : letters) {
    if (!std::strchr(kEverywhere, letter) && !std::strchr(command.options, letter)) {
      fail(STATUS_USAGE, std::string("\"") + command.name + "\" takes no option --" +
                             long_name(letter) + ": see \"portctl " + command.name + " --help\"");
    }
  }
  if (words < command.least || words > command.most) {
    fail(STATUS_USAGE, std::string("usage: portctl ") + command.name + " " + command.usage);
  }
}

}  // namespace

int main(int argc, char **argv) {
  std::setlocale(LC_CTYPE, "");
  Options options;
  std::string letters;
  opterr = 0;
  for (int letter = 0; (letter = getopt_long(argc, argv, "hja:", kOptions, nullptr)) != -1;) {
    letters += static_cast<char>(letter);
    apply_option(options, letter);
  }
  std::vector<std::string> words(argv + optind, argv + argc);
  if (words.empty()) {
    print_overview();
    return options.help ? STATUS_OK : STATUS_USAGE;
  }
  const Command *command = find_command(words.front());
  if (!command) {
    fail_usage("there is no command \"" + visible(words.front()) + "\"");
  }
  if (options.help) {
    print_help(*command);
    return STATUS_OK;
  }
  words.erase(words.begin());
  check_fits(*command, letters, words.size());
  Session session = {options, words, Bus(options.address), colours_on(STDOUT_FILENO)};
  return command->run(session);
}
