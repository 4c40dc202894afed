#include "platform/host/log-line.h"

#include <glib.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <string>

#include "base/log.h"
#include "base/unique-fd.h"

namespace {

std::string in_journal(int level) {
  return log_line({level, "portd", "text"}, true);
}

TEST(LogLine, PutsThePriorityOfTheLevelFirstForTheJournal) {
  EXPECT_EQ(in_journal(G_LOG_LEVEL_ERROR), "<2>ERROR: portd: text\n");
  EXPECT_EQ(in_journal(G_LOG_LEVEL_CRITICAL), "<3>CRITICAL: portd: text\n");
  EXPECT_EQ(in_journal(G_LOG_LEVEL_WARNING), "<4>WARNING: portd: text\n");
  EXPECT_EQ(in_journal(G_LOG_LEVEL_MESSAGE), "<5>MESSAGE: portd: text\n");
  EXPECT_EQ(in_journal(G_LOG_LEVEL_INFO), "<6>INFO: portd: text\n");
  EXPECT_EQ(in_journal(G_LOG_LEVEL_DEBUG), "<7>DEBUG: portd: text\n");
}

TEST(LogLine, TakesALevelOfTheApplicationForInformation) {
  EXPECT_EQ(in_journal(1 << G_LOG_LEVEL_USER_SHIFT), "<6>LEVEL256: portd: text\n");
}

TEST(LogLine, HasOnePriorityOnlyWhateverTheTextHolds) {
  EXPECT_EQ(log_line({G_LOG_LEVEL_INFO, "", "a\n<0>b\r<1>c\n\n"}, true), "<6>INFO: a <0>b <1>c\n");
}

TEST(LogLine, HasNoPriorityElsewhere) {
  EXPECT_EQ(log_line({G_LOG_LEVEL_WARNING, "portd", "text"}, false), "WARNING: portd: text\n");
}

struct Pipe {
  UniqueFd reader;
  UniqueFd writer;
};

Pipe make_pipe() {
  std::array<int, 2> ends{};
  EXPECT_EQ(pipe(ends.data()), 0);
  return {UniqueFd(ends[0]), UniqueFd(ends[1])};
}

std::string stream_of(int descriptor) {
  struct stat file {};
  EXPECT_EQ(fstat(descriptor, &file), 0);
  return std::to_string(file.st_dev) + ":" + std::to_string(file.st_ino);
}

TEST(LogLine, KnowsTheJournalByDeviceAndInode) {
  const auto journal = make_pipe();
  const auto other = make_pipe();
  const auto stream = stream_of(journal.writer.get());
  EXPECT_TRUE(is_journal_stream(journal.writer.get(), stream.c_str()));
  EXPECT_FALSE(is_journal_stream(other.writer.get(), stream.c_str()));
}

TEST(LogLine, TakesNothingElseForTheJournal) {
  const auto pipe = make_pipe();
  const auto stream = stream_of(pipe.writer.get());
  EXPECT_FALSE(is_journal_stream(pipe.writer.get(), nullptr));
  EXPECT_FALSE(is_journal_stream(-1, stream.c_str()));
  for (const auto &odd :
       {std::string(), std::string("1:"), stream + " ", " " + stream, stream + "1"}) {
    EXPECT_FALSE(is_journal_stream(pipe.writer.get(), odd.c_str())) << odd;
  }
}

}  // namespace
