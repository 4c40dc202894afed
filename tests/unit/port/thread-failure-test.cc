// A device that can start no more threads.
#include <dlfcn.h>

#include "support/port-fixture.h"

namespace {

bool threads_fail = false;

}  // namespace

// Takes the place of GLib's for the port layer.
extern "C" GThread *g_thread_try_new(const gchar *name, GThreadFunc function, gpointer data,
                                     GError **error) {
  if (threads_fail) {
    g_set_error_literal(error, G_THREAD_ERROR, G_THREAD_ERROR_AGAIN, "no thread left");
    return nullptr;
  }
  static const auto original =
      reinterpret_cast<decltype(&g_thread_try_new)>(dlsym(RTLD_NEXT, "g_thread_try_new"));
  return original(name, function, data, error);
}

namespace {

class ThreadFailure : public PortFixture {
 protected:
  ThreadFailure() { threads_fail = true; }
  ~ThreadFailure() override { threads_fail = false; }
};

TEST_F(ThreadFailure, RefusesTheSequenceAndLeavesThePortFree) {
  IOPortRef port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  EXPECT_FALSE(io_port_run_action_sequence(port.get(), {false, {{true, 0}}}));
  EXPECT_TRUE(log.took_warning("Could not start action thread: no thread left"));
  EXPECT_FALSE(io_port_is_busy(port.get()));
  EXPECT_EQ(listener.heard(), Lines{});
  port.reset();
  EXPECT_EQ(listener.heard(), Lines{"undeclare siren"});  // no reference was left behind
  io_port_wait_for_action_threads();
}

TEST_F(ThreadFailure, IsOverOnceThreadsCanBeStartedAgain) {
  const IOPortRef port = PortBuilder().output().set_up();
  EXPECT_FALSE(io_port_run_action_sequence(port.get(), {false, {{true, 0}}}));
  EXPECT_TRUE(log.took_warning("Could not start action thread: no thread left"));
  threads_fail = false;
  EXPECT_TRUE(io_port_run_action_sequence(port.get(), {false, {{true, 0}}}));
  io_port_wait_for_action_threads();
  EXPECT_EQ(check_record(port).state, 1);
}

}  // namespace
