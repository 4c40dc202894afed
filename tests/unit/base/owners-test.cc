// UniqueFd, Error and Source: each releases what it holds exactly once.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <utility>

#include "base/glib-ptr.h"
#include "base/source.h"
#include "base/unique-fd.h"
#include "support/deadline.h"
#include "support/log-capture.h"

namespace {

int open_null() {
  return open("/dev/null", O_RDONLY | O_CLOEXEC);
}

bool is_open(int fd) {
  return fcntl(fd, F_GETFD) != -1;
}

TEST(UniqueFd, HoldsNothingUntilGivenADescriptor) {
  const UniqueFd fd;
  EXPECT_FALSE(fd);
  EXPECT_LT(fd.get(), 0);
}

TEST(UniqueFd, TakesDescriptorZeroForOneThatIsHeld) {
  // Not the process's own descriptor 0: the owner would close it.
  UniqueFd saved(fcntl(0, F_DUPFD_CLOEXEC, 3));
  close(0);
  {
    const UniqueFd zero(open_null());
    ASSERT_EQ(zero.get(), 0);
    EXPECT_TRUE(zero);
  }
  EXPECT_FALSE(is_open(0));
  if (saved) {
    EXPECT_EQ(dup2(saved.get(), 0), 0);
  }
}

TEST(UniqueFd, ClosesWhenItsScopeEnds) {
  int number = -1;
  {
    const UniqueFd fd(open_null());
    number = fd.get();
    ASSERT_TRUE(is_open(number));
  }
  EXPECT_FALSE(is_open(number));
}

TEST(UniqueFd, ClosesTheOldDescriptorWhenGivenANewOne) {
  UniqueFd fd(open_null());
  const int first = fd.get();
  fd.reset(open_null());
  const int second = fd.get();
  EXPECT_NE(first, second);
  EXPECT_FALSE(is_open(first));
  EXPECT_TRUE(is_open(second));
  fd.reset();
  EXPECT_FALSE(is_open(second));
  EXPECT_FALSE(fd);
}

TEST(UniqueFd, MovingLeavesTheSourceEmptyAndTheDescriptorOpen) {
  UniqueFd from(open_null());
  const int number = from.get();
  UniqueFd to(std::move(from));
  EXPECT_FALSE(from);  // NOLINT(bugprone-use-after-move): what is left behind is the point
  EXPECT_EQ(to.get(), number);
  EXPECT_TRUE(is_open(number));
}

TEST(UniqueFd, MoveAssignmentClosesWhatWasHeld) {
  UniqueFd kept(open_null());
  UniqueFd dropped(open_null());
  const int dropped_number = dropped.get();
  const int kept_number = kept.get();
  dropped = std::move(kept);
  EXPECT_FALSE(is_open(dropped_number));
  EXPECT_EQ(dropped.get(), kept_number);
  EXPECT_TRUE(is_open(kept_number));
}

TEST(ErrorOwner, IsEmptyAndHasAPrintableMessageUntilACallSetsIt) {
  const Error error;
  EXPECT_FALSE(error);
  EXPECT_EQ(error.get(), nullptr);
  EXPECT_STREQ(error.message(), "unknown error");
  EXPECT_FALSE(error.matches(G_FILE_ERROR, G_FILE_ERROR_NOENT));
}

TEST(ErrorOwner, HoldsWhatACallSet) {
  Error error;
  const GDirPtr directory(g_dir_open("/nonexistent/directory", 0, error.out()));
  EXPECT_EQ(directory, nullptr);
  ASSERT_TRUE(error);
  EXPECT_TRUE(error.matches(G_FILE_ERROR, G_FILE_ERROR_NOENT));
  EXPECT_STREQ(error.message(), error.get()->message);
}

TEST(ErrorOwner, ServesASecondCallAfterAFailedOne) {
  LogCapture log;  // GLib warns when one error is set over another
  Error error;
  g_set_error_literal(error.out(), G_FILE_ERROR, G_FILE_ERROR_NOENT, "first");
  g_set_error_literal(error.out(), G_FILE_ERROR, G_FILE_ERROR_ISDIR, "second");
  EXPECT_STREQ(error.message(), "second");
  (void)error.out();
  EXPECT_FALSE(error);
}

// --- Source ---

gboolean count(gpointer counter) {
  ++*static_cast<int *>(counter);
  return G_SOURCE_CONTINUE;
}

struct OnceState {
  Source source;
  int runs = 0;
};

gboolean run_once(gpointer data) {
  auto *state = static_cast<OnceState *>(data);
  ++state->runs;
  state->source.forget();
  return G_SOURCE_REMOVE;
}

bool has_source_for(gpointer data) {
  return g_main_context_find_source_by_user_data(nullptr, data) != nullptr;
}

TEST(SourceOwner, RemovesItselfWhenItsScopeEnds) {
  int runs = 0;
  {
    const Source source(g_timeout_add(0, count, &runs));
    EXPECT_TRUE(source);
    EXPECT_TRUE(iterate_until([&] { return runs > 0; }));
  }
  EXPECT_FALSE(has_source_for(&runs));
}

TEST(SourceOwner, AssigningRemovesTheSourceHeldBefore) {
  int first = 0;
  int second = 0;
  Source source(g_timeout_add(0, count, &first));
  source = Source(g_timeout_add(0, count, &second));
  EXPECT_FALSE(has_source_for(&first));
  EXPECT_TRUE(has_source_for(&second));
}

TEST(SourceOwner, MovingLeavesTheSourceArmedOnce) {
  int runs = 0;
  Source from(g_timeout_add(0, count, &runs));
  Source to(std::move(from));
  EXPECT_FALSE(from);  // NOLINT(bugprone-use-after-move): what is left behind is the point
  EXPECT_TRUE(has_source_for(&runs));
  to.reset();
  EXPECT_FALSE(to);
  EXPECT_FALSE(has_source_for(&runs));
}

TEST(SourceOwner, LeavesASourceAloneThatEndedByItself) {
  LogCapture log;  // GLib is critical of removing a source that is gone
  OnceState state;
  state.source = Source(g_idle_add(run_once, &state));
  EXPECT_TRUE(iterate_until([&] { return state.runs > 0; }));
  EXPECT_FALSE(state.source);
  EXPECT_FALSE(has_source_for(&state));
}

TEST(SourceOwner, ResettingTwiceRemovesOnce) {
  LogCapture log;
  int runs = 0;
  Source source(g_timeout_add(0, count, &runs));
  source.reset();
  source.reset();
  EXPECT_FALSE(source);
}

}  // namespace
