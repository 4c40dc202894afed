// Action sequences, cancels, references and shutdown from many threads at once. What can go wrong
// here goes wrong seldom, so it is done often; ThreadSanitizer sees what does not show.
#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <random>
#include <thread>
#include <vector>

#include "daemon/backends.h"
#include "port/port-listener.h"
#include "port/port-registry.h"
#include "support/log-capture.h"
#include "support/port-builder.h"

namespace {

constexpr int kTurns = 50000;                       // of each thread
constexpr int kRounds = 1000;                       // of tests that make their ports anew
constexpr std::int32_t kNotInThisTest = 2'000'000;  // half an hour: only a cancel ends the step
constexpr std::array<std::int32_t, 5> kTimes = {0, 0, 1, -1, kNotInThisTest};
constexpr int kPorts = 3;

std::atomic<int> done = 0;
std::atomic<int> changed = 0;
std::atomic<int> sent = 0;

// Counts what it hears; tests read the counts when their threads are gone.
void listen() {
  done = changed = sent = 0;
  port_listener() = {
      .send_event = [](IOPort *, IoEvent *, std::int32_t) { ++sent; },
      .port_changed = [](const PortChange &) { ++changed; },
      .action_sequence_done = [](int) { ++done; },
  };
}

class SequenceStress : public testing::Test {
 protected:
  SequenceStress() {
    backends_register();
    listen();
  }
  ~SequenceStress() override {
    port_registry_drop_all();
    port_listener() = {};
    log.forget();  // refusals are part of the game
  }

  LogCapture log;
};

// A thread's own dice.
class Dice {
 public:
  explicit Dice(unsigned seed) : engine_(seed) {}
  int below(int limit) { return std::uniform_int_distribution<int>(0, limit - 1)(engine_); }

 private:
  std::minstd_rand engine_;
};

IOPortRef configurable_output(int number) {
  return PortBuilder()
      .configurable_output()
      .number(number)
      .event(event_for_outputs("siren"))
      .event(event_for_inputs("alarm"))
      .set_up_and_registered();
}

ActionSequence random_sequence(Dice &dice) {
  ActionSequence sequence{dice.below(4) == 0, {}};
  for (int steps = 1 + dice.below(3); steps > 0; --steps) {
    sequence.steps.push_back(
        {dice.below(2) == 0, kTimes[static_cast<std::size_t>(dice.below(kTimes.size()))]});
  }
  return sequence;
}

// Runs a thread for each piece of work, which is done again and again with dice of the thread's
// own.
template <typename... Work>
void hammer(Work... work) {
  unsigned seed = 1;
  std::vector<std::thread> threads;
  const auto start = [&](auto &task) {
    threads.emplace_back([&task, dice = Dice(seed++)]() mutable {
      for (int turn = 0; turn < kTurns; ++turn) {
        task(dice);
      }
    });
  };
  (start(work), ...);
  for (auto &thread : threads) {
    thread.join();
  }
}

TEST_F(SequenceStress, StartsCancelsAndReadersLeaveEveryPortFree) {
  std::vector<IOPortRef> ports;
  ports.reserve(kPorts);
  for (int number = 0; number < kPorts; ++number) {
    ports.push_back(configurable_output(number));
  }
  std::atomic<int> started = 0;
  const auto any_port = [&](Dice &dice) {
    return ports[static_cast<std::size_t>(dice.below(kPorts))].get();
  };
  const auto start = [&](Dice &dice) {
    if (io_port_run_action_sequence(any_port(dice), random_sequence(dice))) {
      ++started;
    }
    log.forget();
  };
  const auto cancel = [&](Dice &dice) {
    io_port_set_activelow(any_port(dice), dice.below(2) == 0, false);
  };
  const auto turn = [&](Dice &dice) { io_port_set_direction(any_port(dice), dice.below(4) == 0); };
  const auto read = [&](Dice &dice) {
    (void)io_port_get_state(any_port(dice));
    (void)io_port_is_busy(any_port(dice));
    io_port_set_virtual(any_port(dice), dice.below(2) == 0);
  };
  hammer(start, start, cancel, cancel, turn, read);
  for (const auto &port : ports) {
    EXPECT_TRUE(io_port_set_direction(port.get(), false));
    EXPECT_FALSE(io_port_is_busy(port.get()));
  }
  io_port_wait_for_action_threads();
  EXPECT_GT(started, 0);
  EXPECT_EQ(done, started);
  EXPECT_GT(changed, 0);
  EXPECT_GT(sent, 0);
}

TEST_F(SequenceStress, StateChangesSlipInBetweenSteps) {
  const auto port = configurable_output(0);
  const auto start = [&](Dice &dice) {
    (void)io_port_run_action_sequence(port.get(),
                                      {false, {{true, 0}, {false, dice.below(2)}, {true, 0}}});
    log.forget();
  };
  const auto drive = [&](Dice &dice) { io_port_set_state(port.get(), dice.below(2) == 0); };
  hammer(start, drive, drive);
  io_port_wait_for_action_threads();
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

TEST_F(SequenceStress, LookupsKeepPortsAliveThatAreReplacedMeanwhile) {
  for (int number = 0; number < kPorts; ++number) {
    (void)PortBuilder().id("x").output().number(number).set_up_and_registered();
  }
  const auto look_up = [](Dice &dice) {
    if (const auto port = port_registry_find(static_cast<std::uint32_t>(dice.below(kPorts)))) {
      (void)io_port_get_state(port.get());
      io_port_ref(port.get());
      const IOPortRef second(port.get());
      (void)io_port_is_busy(second.get());
    }
  };
  const auto start = [&](Dice &dice) {
    if (const auto port = port_registry_find(static_cast<std::uint32_t>(dice.below(kPorts)))) {
      (void)io_port_run_action_sequence(port.get(), {false, {{true, 0}, {false, 1}}});
    }
    log.forget();
  };
  const auto replace = [](Dice &dice) {
    port_registry_remove_by_id("x");
    (void)PortBuilder().id("x").output().number(dice.below(kPorts)).set_up_and_registered();
  };
  hammer(look_up, look_up, start, replace);
  EXPECT_EQ(port_registry_count(), static_cast<std::size_t>(kPorts));
}

TEST_F(SequenceStress, AStepSeesAWholeListOfRanges) {
  port_listener().send_event = [](IOPort *port, IoEvent *, std::int32_t) {
    const SupervisedRanges ranges = io_port_range_list(port);
    EXPECT_EQ(ranges.size(), static_cast<std::size_t>(ranges.front().upper));
    ++sent;
  };
  const auto port = PortBuilder().event(event_for_inputs("alarm")).set_up_and_registered();
  io_port_store_range_list(port.get(), {{SUPERVISED_STATE_OPEN, 1, 0}});
  constexpr int sequences = 50;
  constexpr int steps = 1000;
  int started = 0;
  for (std::uint32_t length = 1; started < sequences; length = 1 + length % 5) {
    if (!io_port_is_busy(port.get())) {
      ASSERT_TRUE(io_port_run_action_sequence(port.get(),
                                              {true, std::vector<ActionStep>(steps, {true, 0})}));
      ++started;
    }
    io_port_store_range_list(port.get(),
                             SupervisedRanges(length, {SUPERVISED_STATE_OPEN, length, 0}));
  }
  io_port_wait_for_action_threads();
  EXPECT_EQ(sent, sequences * steps);
}

TEST_F(SequenceStress, TheLastReferenceMayGoAnywhere) {
  int started = 0;
  for (int round = 0; round < kRounds; ++round) {
    IOPortRef port = PortBuilder().output().set_up();
    ASSERT_TRUE(io_port_run_action_sequence(port.get(), {false, {{true, 0}, {false, 0}}}));
    ++started;
    io_port_ref(port.get());
    std::thread other([second = IOPortRef(port.get())]() mutable { second.reset(); });
    port.reset();
    other.join();
  }
  io_port_wait_for_action_threads();
  EXPECT_EQ(done, started);
}

TEST_F(SequenceStress, ShutdownEndsWhateverRuns) {
  int started = 0;
  Dice dice(1);
  for (int round = 0; round < kRounds; ++round) {
    for (int number = 0; number < kPorts; ++number) {
      const auto port = configurable_output(number);
      ASSERT_TRUE(io_port_run_action_sequence(port.get(), random_sequence(dice)));
      ++started;
    }
    port_registry_drop_all();
    ASSERT_EQ(done, started);
  }
}

TEST_F(SequenceStress, ShutdownWaitsForSequencesThatEndByThemselves) {
  for (int round = 0; round < kRounds; ++round) {
    for (int number = 0; number < kPorts; ++number) {
      const auto port = configurable_output(number);
      ASSERT_TRUE(io_port_run_action_sequence(port.get(), {false, {{true, 0}, {false, 0}}}));
    }
    port_registry_drop_all();
  }
}

}  // namespace
