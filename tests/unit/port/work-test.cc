// Ports that wait for a service: who waits along, and who does not.
#include <memory>
#include <thread>
#include <utility>
#include <vector>

#include "base/main-queue.h"
#include "port/port-work.h"
#include "registry-fixture.h"
#include "support/deadline.h"

namespace {

constexpr std::int32_t kNotInThisTest = 2'000'000;

class Work : public Registry {
 protected:
  ~Work() override { io_port_wait_for_action_threads(); }

  // How many pieces of work the port has waited for, by the order in which they were begun.
  void note_when_idle(const IOPortRef &port, int number) {
    io_port_when_idle(port.get(), [this, number] { idle_.push_back(number); });
  }

  std::vector<int> idle_;
};

TEST_F(Work, IsIdleAtOnceWhereNothingIsUnderWay) {
  const auto port = PortBuilder().set_up();
  note_when_idle(port, 1);
  EXPECT_EQ(idle_, std::vector<int>{1});
}

TEST_F(Work, IsIdleOnTheMainLoopWhenItHasEndedElsewhere) {
  const auto port = PortBuilder().set_up();
  auto work = std::make_unique<PortWork>(port.get());
  std::thread::id called_on;
  io_port_when_idle(port.get(), [&] { called_on = std::this_thread::get_id(); });
  std::thread([&] { work.reset(); }).join();
  EXPECT_EQ(called_on, std::thread::id());
  EXPECT_TRUE(iterate_until([&] { return called_on == std::this_thread::get_id(); }));
}

TEST_F(Work, IsWaitedForOnlyByThoseWhoCameAfterIt) {
  const auto port = PortBuilder().set_up();
  auto first = std::make_unique<PortWork>(port.get());
  note_when_idle(port, 1);
  auto second = std::make_unique<PortWork>(port.get());
  note_when_idle(port, 2);
  first.reset();
  EXPECT_TRUE(iterate_until([&] { return !idle_.empty(); }));
  EXPECT_EQ(idle_, std::vector<int>{1});
  second.reset();
  EXPECT_TRUE(iterate_until([&] { return idle_.size() == 2; }));
  EXPECT_EQ(idle_, (std::vector<int>{1, 2}));
}

TEST_F(Work, KeepsItsPortUntilTheMainLoopKnows) {
  auto port = PortBuilder().event(event_for_inputs("alarm")).set_up();
  auto work = std::make_unique<PortWork>(port.get());
  port.reset();
  std::thread([&] { work.reset(); }).join();
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_TRUE(iterate_until([&] { return listener.times("undeclare alarm") == 1; }));
}

TEST_F(Work, HoldsTheTimeOfAStepBackButNotTheLock) {
  const auto port = PortBuilder().output().set_up();
  auto work = std::make_unique<PortWork>(port.get());
  ASSERT_TRUE(io_port_run_action_sequence(port.get(), {false, {{true, 0}, {false, 0}}}));
  EXPECT_TRUE(listener.wait_for("changed 1 on"));
  EXPECT_TRUE(io_port_set_output_name(port.get(), "Siren"));
  EXPECT_EQ(listener.times("changed 1 off"), 0U);
  work.reset();
  EXPECT_TRUE(listener.wait_for("done 1"));
  EXPECT_EQ(listener.times("changed 1 off"), 1U);
}

TEST_F(Work, DoesNotHoldTheEndOfASequenceBack) {
  const auto port = PortBuilder().output().set_up();
  const PortWork work(port.get());
  ASSERT_TRUE(io_port_run_action_sequence(port.get(), {false, {{true, kNotInThisTest}}}));
  EXPECT_TRUE(listener.wait_for("changed 1 on"));
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_TRUE(listener.wait_for("done 1"));
}

// --- A set-up that waits ---

std::unique_ptr<PortWork> under_way;
bool comes_up = true;

// A backend whose service answers when the test says so.
constexpr PortFunctions kWaitingBackend = {
    .setup =
        [](IOPort *port, bool /*level*/) {
          under_way = std::make_unique<PortWork>(port);
          return false;
        },
};
constexpr auto kWaitingKind = static_cast<BackendKind>(BACKEND_CHECK + 1);

class SetUpThatWaits : public Work {
 protected:
  SetUpThatWaits() {
    io_port_register_backend({"waiting", kWaitingKind, &kWaitingBackend});
    comes_up = true;
    parked_ = ::port("slow", 0).optional().backend(kWaitingKind).registered();
    port_registry_park(parked_.get());
  }
  ~SetUpThatWaits() override { parked_.reset(); }

  void answer() {
    const auto work = std::move(under_way);
    if (comes_up) {
      io_port_finish_setup(parked_.get());
    }
  }
  void retry() {
    port_registry_retry_parked([this](std::size_t count) { back_.push_back(count); });
  }
  bool iterate_until_answered(std::size_t callers) {
    return iterate_until([&] { return back_.size() == callers; });
  }

  IOPortRef parked_;
  std::vector<std::size_t> back_;  // what each caller was told
};

TEST_F(SetUpThatWaits, LetsTheCallerOfARetryWaitAndNobodyElse) {
  retry();
  EXPECT_TRUE(back_.empty());
  EXPECT_EQ(port_registry_count(), 0U);
  answer();
  EXPECT_TRUE(iterate_until_answered(1));
  EXPECT_EQ(back_, std::vector<std::size_t>{1});
  EXPECT_EQ(ids_in_order(), Lines{"slow"});
}

TEST_F(SetUpThatWaits, IsTriedAnewForThoseWhoAskedMeanwhile) {
  comes_up = false;
  retry();
  retry();
  retry();
  answer();
  EXPECT_TRUE(iterate_until_answered(1));
  EXPECT_EQ(back_, std::vector<std::size_t>{0});
  comes_up = true;
  answer();
  EXPECT_TRUE(iterate_until_answered(3));
  EXPECT_EQ(back_, (std::vector<std::size_t>{0, 1, 1}));
}

TEST_F(SetUpThatWaits, IsWaitedForByWhoNeedsTheOutcome) {
  post_to_main_loop([&] { answer(); });
  EXPECT_TRUE(io_port_setup(parked_.get()));
}

}  // namespace
