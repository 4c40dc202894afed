// The thread that waits for storage, and the saves that are asked of it.
#include <condition_variable>
#include <mutex>
#include <thread>

#include "settings/param-fixture.h"
#include "settings/storage-writer.h"

namespace {

constexpr std::int64_t kLongUs = 60'000'000;

bool finish() {
  return storage_writer_finish(g_get_monotonic_time() + kLongUs);
}

// Work that begins, waits to be let go on, and is counted.
std::mutex gate_lock;
std::condition_variable gate_changed;
bool gate_open;
int begun;
int done;
std::thread::id worker;

void gated_work() {
  std::unique_lock lock(gate_lock);
  ++begun;
  worker = std::this_thread::get_id();
  gate_changed.notify_all();
  gate_changed.wait(lock, [] { return gate_open; });
  ++done;
}

int other_runs;

void other_work() {
  const std::lock_guard lock(gate_lock);
  ++other_runs;
}

void wait_until_begun() {
  std::unique_lock lock(gate_lock);
  gate_changed.wait(lock, [] { return begun > 0; });
}

void open_gate() {
  const std::lock_guard lock(gate_lock);
  gate_open = true;
  gate_changed.notify_all();
}

class StorageWriter : public Settings {
 protected:
  StorageWriter() {
    gate_open = false;
    begun = done = other_runs = 0;
  }
  ~StorageWriter() override {
    open_gate();
    EXPECT_TRUE(finish());
  }

  // Has the writer busy, so that what is asked for waits.
  static void hold_up() {
    storage_writer_request(gated_work);
    wait_until_begun();
  }
};

TEST_F(StorageWriter, WorksOnAThreadOfItsOwn) {
  hold_up();
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(done, 1);
  EXPECT_NE(worker, std::this_thread::get_id());
}

TEST_F(StorageWriter, DoesWorkThatWaitsOnce) {
  hold_up();
  for (int times = 0; times < 3; ++times) {
    storage_writer_request(other_work);
    storage_writer_request(gated_work);
  }
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(other_runs, 1);
  EXPECT_EQ(done, 2);
}

TEST_F(StorageWriter, GivesUpOnStorageThatHangs) {
  hold_up();
  storage_writer_request(other_work);
  EXPECT_FALSE(storage_writer_finish(g_get_monotonic_time()));
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(other_runs, 1);
}

TEST_F(StorageWriter, BeginsAnewAfterItsEnd) {
  storage_writer_request(other_work);
  EXPECT_TRUE(finish());
  storage_writer_request(other_work);
  EXPECT_TRUE(finish());
  EXPECT_EQ(other_runs, 2);
  EXPECT_TRUE(finish());
}

// --- Saves ---

class RequestedSaves : public StorageWriter {
 protected:
  const IOPortRef door = PortBuilder().id("door").input().names("Door", "").build();
  const IOPortRef gate = PortBuilder().id("gate").input().names("Gate", "").build();

  void rename_and_request(const IOPortRef &port, const char *name) const {
    io_port_set_input_name(port.get(), name);
    param_request_save(port.get(), file);
  }
  static std::string group(const char *id, const char *name) {
    return std::string("[") + id + "]\ninput_name=" + name + "\ninput_activelow=false\n";
  }
};

TEST_F(RequestedSaves, StoreWhatThePortWasAtTheRequest) {
  hold_up();
  param_request_save(door.get(), file);
  io_port_set_input_name(door.get(), "Renamed since");
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(contents(), group("door", "Door"));
}

TEST_F(RequestedSaves, OfOnePortEndWithTheLast) {
  hold_up();
  for (const char *name : {"1", "2", "3"}) {
    rename_and_request(door, name);
    rename_and_request(gate, name);
  }
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(contents(), group("door", "3") + "\n" + group("gate", "3"));
}

TEST_F(RequestedSaves, AreSeenByWhoeverReadsTheFileBeforeTheyAreStored) {
  hold_up();
  rename_and_request(door, "Asked for");
  ASSERT_TRUE(param_read_configuration(file));
  const auto reader = PortBuilder().id("door").input().build();
  EXPECT_TRUE(param_get_conf_vals(reader.get()));
  EXPECT_EQ(io_port_get_name(reader.get()), "Asked for");
}

TEST_F(RequestedSaves, GiveWayToALaterSaveThatDoesNotWait) {
  hold_up();
  rename_and_request(door, "Earlier");
  rename_and_request(gate, "Asked for");
  io_port_set_input_name(door.get(), "Later");
  param_save_for_port(door.get(), file);
  EXPECT_EQ(contents(), group("door", "Later") + "\n" + group("gate", "Asked for"));
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(contents(), group("door", "Later") + "\n" + group("gate", "Asked for"));
}

TEST_F(RequestedSaves, TellFromTheMainLoopWhenTheyHaveEnded) {
  OutputCapture standard_error(STDERR_FILENO);
  hold_up();
  std::vector<std::string> stored;
  const auto note = [&] { stored.push_back(contents()); };
  param_request_save(door.get(), file, note);
  param_request_save(IOPortRef(io_port_new()).get(), file, note);
  g_main_context_iteration(nullptr, TRUE);
  EXPECT_EQ(stored, Lines{"(no file)"});  // a port that can't be saved has nothing to wait for
  open_gate();
  EXPECT_TRUE(finish());
  EXPECT_EQ(stored.size(), 1U);
  g_main_context_iteration(nullptr, TRUE);
  EXPECT_EQ(stored, (Lines{"(no file)", group("door", "Door")}));
}

TEST_F(RequestedSaves, OfPortsWithoutAUsableNameAreNone) {
  OutputCapture standard_error(STDERR_FILENO);
  param_request_save(IOPortRef(io_port_new()).get(), file);
  EXPECT_TRUE(finish());
  EXPECT_EQ(standard_error.text(), "Port does not have a name!\n");
  EXPECT_EQ(dir.names(), Lines{});
}

TEST_F(RequestedSaves, SayWhatWentWrong) {
  dir.write("portd.conf", "no key file");
  OutputCapture standard_error(STDERR_FILENO);
  param_request_save(door.get(), file);
  EXPECT_TRUE(finish());
  EXPECT_TRUE(standard_error.text().starts_with("Could not read key file: "));
  EXPECT_TRUE(
      log.took_critical("param_save_for_port: assertion 'param_read_configuration (file)' failed"));
  EXPECT_EQ(contents(), "no key file");
}

TEST_F(RequestedSaves, WhileThePortChangesOnAnotherThread) {
  constexpr int rounds = 50;
  std::thread saver([&] {
    for (int round = 0; round < rounds; ++round) {
      param_save_for_port(gate.get(), file);
    }
  });
  for (int round = 0; round < rounds; ++round) {
    rename_and_request(door, std::to_string(round).c_str());
  }
  saver.join();
  EXPECT_TRUE(finish());
  EXPECT_NE(contents().find(group("door", "49")), std::string::npos) << contents();
  EXPECT_NE(contents().find(group("gate", "Gate")), std::string::npos) << contents();
}

}  // namespace
