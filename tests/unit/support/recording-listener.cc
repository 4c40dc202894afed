#include "support/recording-listener.h"

#include <glib.h>

#include <algorithm>
#include <utility>

#include "port/io-event.h"
#include "support/deadline.h"

namespace {

RecordingListener *current = nullptr;

std::string name_of(const IoEvent *event) {
  return event->name.value_or("(none)");
}

bool declare_event(IOPort * /*port*/, IoEvent *event) {
  current->record("declare " + name_of(event));
  return !current->refuses(name_of(event));
}

void undeclare_event(IoEvent *event) {
  current->record("undeclare " + name_of(event));
}

void redeclare_event(IOPort * /*port*/, IoEvent *event) {
  current->record("redeclare " + name_of(event));
}

void send_event(IOPort * /*port*/, IoEvent *event, std::int32_t state) {
  current->record("send " + name_of(event) + " " + std::to_string(state));
}

void port_changed(const PortChange &change) {
  current->record_change(change);
}

void action_sequence_done(int number) {
  current->record("done " + std::to_string(number));
}

}  // namespace

RecordingListener::RecordingListener() {
  current = this;
  port_listener() = {.declare_event = declare_event,
                     .undeclare_event = undeclare_event,
                     .redeclare_event = redeclare_event,
                     .send_event = send_event,
                     .port_changed = port_changed,
                     .action_sequence_done = action_sequence_done};
}

RecordingListener::~RecordingListener() {
  port_listener() = {};
  current = nullptr;
}

Lines RecordingListener::heard() {
  const std::lock_guard lock(lock_);
  const auto first = all_.begin() + static_cast<std::ptrdiff_t>(std::exchange(told_, all_.size()));
  return {first, all_.end()};
}

bool RecordingListener::wait_for(std::string_view line) {
  const std::int64_t deadline = deadline_of_a_test();
  std::unique_lock lock(lock_);
  while (g_get_monotonic_time() < deadline) {
    const auto first = all_.begin() + static_cast<std::ptrdiff_t>(told_);
    if (std::find(first, all_.end(), line) != all_.end()) {
      return true;
    }
    more_.wait_until(lock, deadline);
  }
  return false;
}

std::size_t RecordingListener::times(std::string_view line) {
  const std::lock_guard lock(lock_);
  return static_cast<std::size_t>(std::count(all_.begin(), all_.end(), line));
}

std::vector<PortChange> RecordingListener::changes() {
  const std::lock_guard lock(lock_);
  return changes_;
}

void RecordingListener::refuse(std::string name) {
  const std::lock_guard lock(lock_);
  refused_ = std::move(name);
}

void RecordingListener::record(std::string line) {
  const std::lock_guard lock(lock_);
  all_.push_back(std::move(line));
  more_.notify_all();
}

void RecordingListener::record_change(const PortChange &change) {
  {
    const std::lock_guard lock(lock_);
    changes_.push_back(change);
  }
  record("changed " + std::to_string(change.number) + (change.state ? " on" : " off"));
}

bool RecordingListener::refuses(const std::string &name) {
  const std::lock_guard lock(lock_);
  return refused_ == name;
}
