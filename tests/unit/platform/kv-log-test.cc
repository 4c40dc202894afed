// Each test logs from a child process: what GLib's log goes to can't be taken back.
#include "platform/kv-log.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <string>

#include "base/log.h"
#include "base/unique-fd.h"
#include "support/output-capture.h"

namespace {

struct ChildOutput {
  std::string text;
  int status = 0;
};

// What a child prints that routes its log to standard output and then logs.
ChildOutput output_of(void (*logs)()) {
  std::array<int, 2> ends{};
  EXPECT_EQ(pipe(ends.data()), 0);
  const UniqueFd reader(ends[0]);
  UniqueFd writer(ends[1]);
  const pid_t child = fork();
  if (child == 0) {
    dup2(writer.get(), STDOUT_FILENO);
    kv_log_stdout();
    logs();
    _exit(EXIT_SUCCESS);
  }
  writer.reset();
  ChildOutput output{read_to_end(reader.get())};
  EXPECT_EQ(waitpid(child, &output.status, 0), child);
  return output;
}

TEST(KvLog, PrintsALineWithTheLevelForEachMessage) {
  const auto output = output_of([] {
    log_critical("one %d", 1);
    log_warning("two");
    g_message("three");
    log_info("four");
  });
  EXPECT_EQ(output.text,
            "CRITICAL: portd: one 1\nWARNING: portd: two\nMESSAGE: portd: three\n"
            "INFO: portd: four\n");
  EXPECT_TRUE(WIFEXITED(output.status));
}

TEST(KvLog, NamesTheDaemonsOwnLevelByItsNumber) {
  const auto output = output_of([] { log_user("box"); });
  EXPECT_EQ(output.text, "LEVEL256: portd: box\n");
}

TEST(KvLog, PrintsMessagesOfOtherDomainsAndOfNone) {
  const auto output = output_of([] {
    g_log("GLib-GIO", G_LOG_LEVEL_WARNING, "theirs");
    g_log(nullptr, G_LOG_LEVEL_WARNING, "nobody's");
  });
  EXPECT_EQ(output.text, "WARNING: GLib-GIO: theirs\nWARNING: nobody's\n");
}

// The writer's own pipe stands for the stream that the journal has opened.
void name_own_output_as_journal() {
  struct stat file {};
  EXPECT_EQ(fstat(STDOUT_FILENO, &file), 0);
  const auto stream = std::to_string(file.st_dev) + ":" + std::to_string(file.st_ino);
  g_setenv("JOURNAL_STREAM", stream.c_str(), TRUE);
}

TEST(KvLog, TellsTheJournalTheLevel) {
  const auto output = output_of([] {
    name_own_output_as_journal();
    log_critical("one");
    log_info("two");
  });
  EXPECT_EQ(output.text, "<3>CRITICAL: portd: one\n<6>INFO: portd: two\n");
}

TEST(KvLog, TellsNobodyElseWhatTheJournalOfItsCallerIs) {
  const auto output = output_of([] {
    g_setenv("JOURNAL_STREAM", "8:12345678", TRUE);
    log_critical("one");
  });
  EXPECT_EQ(output.text, "CRITICAL: portd: one\n");
}

TEST(KvLog, KeepsAMessageOnOneLineWhateverItHolds) {
  const auto output = output_of([] {
    log_warning("port \"x\nCRITICAL: portd: forged\" is odd");
    log_warning("a\r\nb\rc");
    log_critical("ends with line breaks\n\n");
    log_warning("");
  });
  EXPECT_EQ(output.text,
            "WARNING: portd: port \"x CRITICAL: portd: forged\" is odd\n"
            "WARNING: portd: a  b c\n"
            "CRITICAL: portd: ends with line breaks\n"
            "WARNING: portd: \n");
}

TEST(KvLog, LeavesDebugMessagesOutUntilTheyAreAskedFor) {
  const auto quiet = output_of([] {
    g_unsetenv("G_MESSAGES_DEBUG");
    g_debug("hidden");
  });
  EXPECT_EQ(quiet.text, "");
  const auto talkative = output_of([] {
    g_setenv("G_MESSAGES_DEBUG", "portd", TRUE);
    g_debug("shown");
  });
  EXPECT_EQ(talkative.text, "DEBUG: portd: shown\n");
}

TEST(KvLog, HasPrintedAMessageBeforeTheProcessDies) {
  const auto output = output_of([] {
    log_warning("last words");
    std::raise(SIGKILL);
  });
  EXPECT_EQ(output.text, "WARNING: portd: last words\n");
  EXPECT_TRUE(WIFSIGNALED(output.status));
}

}  // namespace
