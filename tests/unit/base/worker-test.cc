#include "base/worker.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <vector>

#include "base/main-queue.h"
#include "support/deadline.h"

namespace {

// Waits as a call of a service that never answers does.
void hang(GCancellable *cancellable) {
  GPollFD poll{};
  if (!g_cancellable_make_pollfd(cancellable, &poll)) {
    return;
  }
  g_poll(&poll, 1, static_cast<gint>(kTestTimeoutUs / 1000));
  g_cancellable_release_fd(cancellable);
}

TEST(Worker, RunsJobsInTheirOrderOnAThreadOfItsOwn) {
  std::vector<int> order;
  std::vector<GThread *> threads;
  Worker worker("test");
  for (const int number : {1, 2, 3}) {
    worker.queue([&, number](GCancellable * /*cancellable*/) {
      order.push_back(number);
      threads.push_back(g_thread_self());
    });
  }
  worker.stop();
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
  EXPECT_EQ(threads, std::vector<GThread *>(3, threads.front()));
  EXPECT_NE(threads.front(), g_thread_self());
}

TEST(Worker, RunsJobsThatComeWhenItHasNothingToDo) {
  Worker worker("test");
  int answered = 0;
  for (int round = 1; round <= 3; ++round) {
    worker.queue([&](GCancellable * /*cancellable*/) { post_to_main_loop([&] { ++answered; }); });
    EXPECT_TRUE(iterate_until([&] { return answered == round; }));
  }
}

TEST(Worker, CancelsWhatHangsAndWhatWaitsBehindItWhenStopped) {
  std::vector<gboolean> cancelled;
  Worker worker("test");
  for (int job = 0; job < 2; ++job) {
    worker.queue([&](GCancellable *cancellable) {
      hang(cancellable);
      cancelled.push_back(g_cancellable_is_cancelled(cancellable));
    });
  }
  const std::int64_t begun = g_get_monotonic_time();
  worker.stop();
  EXPECT_LT(g_get_monotonic_time() - begun, kTestTimeoutUs / 2);
  EXPECT_EQ(cancelled, (std::vector<gboolean>{TRUE, TRUE}));
}

TEST(Worker, CancelsOnlyWhatWasQueuedBefore) {
  std::vector<gboolean> cancelled;
  Worker worker("test");
  worker.queue([&](GCancellable *cancellable) {
    hang(cancellable);
    cancelled.push_back(g_cancellable_is_cancelled(cancellable));
  });
  worker.cancel();
  std::atomic<bool> done = false;
  worker.queue([&](GCancellable *cancellable) {
    cancelled.push_back(g_cancellable_is_cancelled(cancellable));
    done = true;
  });
  EXPECT_TRUE(iterate_until([&] { return done.load(); }));
  worker.stop();
  EXPECT_EQ(cancelled, (std::vector<gboolean>{TRUE, FALSE}));
}

TEST(Worker, DestroysAJobThatComesTooLateAndSaysSo) {
  Worker worker("test");
  worker.stop();
  auto held = std::make_shared<int>(0);
  EXPECT_FALSE(worker.queue([held](GCancellable * /*cancellable*/) { *held = 1; }));
  EXPECT_EQ(held.use_count(), 1);
  EXPECT_EQ(*held, 0);
}

TEST(Worker, ReleasesWhatAJobHeldWhenItHasRun) {
  Worker worker("test");
  auto held = std::make_shared<int>(0);
  worker.queue([held](GCancellable * /*cancellable*/) { *held = 1; });
  worker.stop();
  EXPECT_EQ(held.use_count(), 1);
  EXPECT_EQ(*held, 1);
}

TEST(Worker, IsStoppedWithAllOthersAndMoreThanOnce) {
  Worker first("first");
  Worker second("second");
  int run = 0;
  first.queue([&](GCancellable *cancellable) { hang(cancellable); });
  second.queue([&](GCancellable *cancellable) { hang(cancellable); });
  Worker::stop_all();
  Worker::stop_all();
  first.queue([&](GCancellable * /*cancellable*/) { ++run; });
  EXPECT_EQ(run, 0);
}

TEST(MainQueue, RunsWhatWasPostedInItsOrderOnTheMainLoop) {
  std::vector<int> order;
  for (const int number : {1, 2, 3}) {
    post_to_main_loop([&, number] { order.push_back(number); });
  }
  EXPECT_TRUE(order.empty());
  EXPECT_TRUE(iterate_until([&] { return order.size() == 3; }));
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST(MainQueue, RunsAtTheEndWhatIsLeftAndWhatThatPosts) {
  int run = 0;
  post_to_main_loop([&] {
    ++run;
    post_to_main_loop([&] { ++run; });
  });
  run_posted_work();
  EXPECT_EQ(run, 2);
  run_posted_work();
  EXPECT_EQ(run, 2);
}

TEST(MainQueue, ServesTheLoopUntilAnotherThreadHasPosted) {
  Worker worker("test");
  bool done = false;
  worker.queue([&](GCancellable * /*cancellable*/) { post_to_main_loop([&] { done = true; }); });
  serve_main_loop_until([&] { return done; });
  EXPECT_TRUE(done);
}

}  // namespace
