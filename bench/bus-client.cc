// A client that is not the bottleneck of what it measures: it serialises its call once, speaks to
// the bus over a bare socket, and only looks at the few bytes of an answer that tell which call it
// belongs to. Prints one line of JSON.
//
//   bus-client SOCKET DESTINATION PATH INTERFACE METHOD ARGUMENTS COUNT IN_FLIGHT [PAUSE_US]
//
// ARGUMENTS is a tuple in GVariant's text form. IN_FLIGHT calls are kept under way; 0 sends all
// without waiting and then collects the answers; "none" has them want no answer, and ends when the
// service has read them all. With PAUSE_US one call is made each so often, until standard input
// ends or COUNT is reached.
#include <gio/gio.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace {

constexpr std::size_t kHeader = 16;
constexpr std::uint8_t kReturn = 2;
constexpr std::uint8_t kError = 3;
constexpr std::uint8_t kReplySerial = 5;
constexpr std::uint8_t kNoReplyExpected = 1;

[[noreturn]] void die(const char *what) {
  std::perror(what);
  std::exit(EXIT_FAILURE);
}

std::int64_t now_ns() {
  timespec time{};
  clock_gettime(CLOCK_MONOTONIC, &time);
  return std::int64_t{time.tv_sec} * 1'000'000'000 + time.tv_nsec;
}

std::uint32_t read_u32(const std::uint8_t *bytes) {
  std::uint32_t value = 0;
  std::memcpy(&value, bytes, sizeof value);
  return value;
}

std::size_t aligned(std::size_t position, std::size_t to) {
  return (position + to - 1) / to * to;
}

// One end of the bus's socket, after the handshake.
class Bus {
 public:
  explicit Bus(const char *path) : fd_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path);
    if (connect(fd_, reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0) {
      die(path);
    }
    shake_hands();
  }

  void send(const std::vector<std::uint8_t> &bytes) {
    std::size_t sent = 0;
    while (sent < bytes.size()) {
      const ssize_t n = write(fd_, bytes.data() + sent, bytes.size() - sent);
      if (n <= 0) {
        die("write");
      }
      sent += static_cast<std::size_t>(n);
    }
  }

  int fd() const { return fd_; }

  // Reads what is there, waiting for at least some of it, and hands each answer's serial on.
  template <typename OnAnswer>
  void receive(OnAnswer on_answer) {
    std::uint8_t chunk[65536];
    const ssize_t n = read(fd_, chunk, sizeof chunk);
    if (n <= 0) {
      die("read");
    }
    pending_.insert(pending_.end(), chunk, chunk + n);
    std::size_t at = 0;
    while (pending_.size() - at >= kHeader) {
      const std::uint8_t *message = pending_.data() + at;
      const std::size_t size = aligned(kHeader + read_u32(message + 12), 8) + read_u32(message + 4);
      if (pending_.size() - at < size) {
        break;
      }
      if (message[1] == kReturn || message[1] == kError) {
        on_answer(reply_serial(message), message[1] == kError);
      }
      at += size;
    }
    pending_.erase(pending_.begin(), pending_.begin() + static_cast<std::ptrdiff_t>(at));
  }

 private:
  void shake_hands() {
    char hex[64] = "";
    const std::string uid = std::to_string(getuid());
    for (std::size_t i = 0; i < uid.size(); ++i) {
      std::snprintf(hex + 2 * i, 3, "%02x", static_cast<unsigned>(uid[i]));
    }
    std::string hello = std::string(1, '\0') + "AUTH EXTERNAL " + hex + "\r\n";
    send({hello.begin(), hello.end()});
    char answer[256];
    if (read(fd_, answer, sizeof answer) <= 0 || std::memcmp(answer, "OK ", 3) != 0) {
      die("AUTH");
    }
    hello = "BEGIN\r\n";
    send({hello.begin(), hello.end()});
  }

  static std::uint32_t reply_serial(const std::uint8_t *message) {
    const std::size_t end = kHeader + read_u32(message + 12);
    std::size_t at = kHeader;
    while (at < end) {
      at = aligned(at, 8);
      const std::uint8_t code = message[at];
      const char type = static_cast<char>(message[at + 2]);
      at += 4;  // code, length of the signature, a single letter, nul
      if (type == 'u') {
        at = aligned(at, 4);
        if (code == kReplySerial) {
          return read_u32(message + at);
        }
        at += 4;
      } else if (type == 'g') {
        at += message[at] + 2U;
      } else {
        at = aligned(at, 4);
        at += read_u32(message + at) + 5U;
      }
    }
    return 0;
  }

  int fd_;
  std::vector<std::uint8_t> pending_;
};

std::vector<std::uint8_t> serialise(const char *destination, const char *path,
                                    const char *interface, const char *method,
                                    GVariant *arguments) {
  GDBusMessage *message = g_dbus_message_new_method_call(destination, path, interface, method);
  g_dbus_message_set_byte_order(message, G_DBUS_MESSAGE_BYTE_ORDER_LITTLE_ENDIAN);
  g_dbus_message_set_serial(message, 1);
  if (arguments) {
    g_dbus_message_set_body(message, arguments);
  }
  gsize size = 0;
  GError *error = nullptr;
  guchar *bytes = g_dbus_message_to_blob(message, &size, G_DBUS_CAPABILITY_FLAGS_NONE, &error);
  if (!bytes) {
    std::fprintf(stderr, "%s\n", error->message);
    std::exit(EXIT_FAILURE);
  }
  std::vector<std::uint8_t> blob(bytes, bytes + size);
  g_free(bytes);
  g_object_unref(message);
  return blob;
}

void set_serial(std::vector<std::uint8_t> &blob, std::uint32_t serial) {
  std::memcpy(blob.data() + 8, &serial, sizeof serial);
}

struct Run {
  std::vector<std::int64_t> sent;   // by serial, after the first two
  std::vector<std::int64_t> taken;  // nanoseconds, in the order of the answers
  std::size_t errors = 0;
};

constexpr std::uint32_t kFirstSerial = 2;

void call_all(Bus &bus, std::vector<std::uint8_t> &call, std::size_t count, std::size_t in_flight,
              std::int64_t pause_ns, Run &run) {
  const auto on_answer = [&](std::uint32_t serial, bool error) {
    if (serial >= kFirstSerial && serial - kFirstSerial < run.sent.size()) {
      run.taken.push_back(now_ns() - run.sent[serial - kFirstSerial]);
      run.errors += error ? 1 : 0;
    }
  };
  const auto send_one = [&] {
    set_serial(call, kFirstSerial + static_cast<std::uint32_t>(run.sent.size()));
    run.sent.push_back(now_ns());
    bus.send(call);
  };
  if (in_flight == 0) {
    // Answers are read while the calls go out, so that the bus never stops taking them.
    while (run.sent.size() < count) {
      send_one();
      pollfd readable = {bus.fd(), POLLIN, 0};
      if (poll(&readable, 1, 0) > 0) {
        bus.receive(on_answer);
      }
    }
  }
  while (run.taken.size() < count) {
    while (in_flight > 0 && run.sent.size() < count &&
           run.sent.size() - run.taken.size() < in_flight) {
      send_one();
    }
    bus.receive(on_answer);
    if (pause_ns > 0) {
      pollfd input = {STDIN_FILENO, POLLIN, 0};
      if (poll(&input, 1, static_cast<int>(pause_ns / 1'000'000)) > 0) {
        return;
      }
    }
  }
}

// Many at once: one write a call would be slower than a service can read them. GDBus answers a ping
// where it reads it, so after all that came before.
void call_without_answers(Bus &bus, const char *destination, std::vector<std::uint8_t> &call,
                          std::size_t count) {
  constexpr std::size_t at_once = 500;
  call[2] |= kNoReplyExpected;
  std::vector<std::uint8_t> calls;
  for (std::size_t i = 0; i < count; ++i) {
    calls.insert(calls.end(), call.begin(), call.end());
    if (i % at_once == at_once - 1 || i == count - 1) {
      bus.send(calls);
      calls.clear();
    }
  }
  auto ping = serialise(destination, "/", "org.freedesktop.DBus.Peer", "Ping", nullptr);
  set_serial(ping, kFirstSerial);
  bus.send(ping);
  bool answered = false;
  while (!answered) {
    bus.receive([&](std::uint32_t serial, bool /*error*/) { answered |= serial == kFirstSerial; });
  }
}

double at(const std::vector<std::int64_t> &sorted, double part) {
  const auto index = static_cast<std::size_t>(part * static_cast<double>(sorted.size() - 1));
  return static_cast<double>(sorted[index]) / 1000.0;
}

}  // namespace

int main(int argc, char **argv) {
  if (argc < 9) {
    std::fputs(
        "usage: bus-client SOCKET DESTINATION PATH INTERFACE METHOD ARGUMENTS COUNT IN_FLIGHT "
        "[PAUSE_US]\n",
        stderr);
    return 2;
  }
  Bus bus(argv[1]);
  auto hello = serialise("org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                         "Hello", nullptr);
  bus.send(hello);
  bool greeted = false;
  while (!greeted) {
    bus.receive([&](std::uint32_t /*serial*/, bool /*error*/) { greeted = true; });
  }
  GVariant *arguments = g_variant_parse(nullptr, argv[6], nullptr, nullptr, nullptr);
  if (!arguments) {
    std::fprintf(stderr, "not a tuple: %s\n", argv[6]);
    return 2;
  }
  auto call = serialise(argv[2], argv[3], argv[4], argv[5], arguments);
  Run run;
  const std::int64_t begun = now_ns();
  const std::size_t count = std::strtoul(argv[7], nullptr, 10);
  if (std::strcmp(argv[8], "none") == 0) {
    call_without_answers(bus, argv[2], call, count);
    std::printf("{\"seconds\": %.6f}\n", static_cast<double>(now_ns() - begun) / 1e9);
    return EXIT_SUCCESS;
  }
  call_all(bus, call, count, std::strtoul(argv[8], nullptr, 10),
           argc > 9 ? std::strtoll(argv[9], nullptr, 10) * 1000 : 0, run);
  const double seconds = static_cast<double>(now_ns() - begun) / 1e9;
  std::sort(run.taken.begin(), run.taken.end());
  if (run.taken.empty()) {
    return EXIT_FAILURE;
  }
  std::printf(
      "{\"calls\": %zu, \"errors\": %zu, \"seconds\": %.6f, \"median_us\": %.2f, "
      "\"p99_us\": %.2f, \"max_us\": %.2f}\n",
      run.taken.size(), run.errors, seconds, at(run.taken, 0.5), at(run.taken, 0.99),
      at(run.taken, 1.0));
  return EXIT_SUCCESS;
}
