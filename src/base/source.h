// A source of the default main context that removes itself. Assigning a new id removes the source
// held before, so a holder never has two armed at once. Main thread only.
//
// A callback that returns G_SOURCE_REMOVE ends its source itself, so the holder must no longer have
// its id by then: the callback calls forget() or reset(), or assigns another source.
#pragma once

#include <glib.h>

#include <utility>

class Source {
 public:
  Source() = default;
  explicit Source(guint id) : id_(id) {}
  Source(Source &&other) noexcept : id_(std::exchange(other.id_, 0)) {}
  Source &operator=(Source &&other) noexcept {
    reset();
    id_ = std::exchange(other.id_, 0);
    return *this;
  }
  Source(const Source &) = delete;
  Source &operator=(const Source &) = delete;
  ~Source() { reset(); }

  explicit operator bool() const { return id_ != 0; }
  void reset() {
    if (id_ != 0) {
      g_source_remove(std::exchange(id_, 0));
    }
  }
  void forget() { id_ = 0; }

 private:
  guint id_ = 0;
};
