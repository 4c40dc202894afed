#include <string>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "fixture.h"
#include "port/port-error.h"
#include "settings/param-legacy.h"
#include "support/file-size-limit.h"

namespace {

class UpgradeTest : public LegacyTest {
 protected:
  // The message of the error, or of the log, that tells why nothing was stored.
  static std::string upgrade(const std::string &input, const std::string &output) {
    Error error;
    const bool stored = param_upgrade(input.c_str(), output.c_str(), error.out());
    EXPECT_FALSE(stored && error);
    return error ? error.message() : "";
  }
};

// Where groups are set apart by empty lines differs between versions of GLib.
std::string without_empty_lines(std::string text) {
  for (std::size_t end = 0; (end = text.find("\n\n", end)) != std::string::npos;) {
    text.erase(end, 1);
  }
  return text;
}

TEST_F(UpgradeTest, values_are_copied_as_they_stand) {
  const std::string input =
      write_file("in", "[a]\nkept=no\nraw=\" x\\s;\\\\ \n[b]\nnew=1\nnew[de]=2\n");
  const std::string output = write_file("out", "[a]\n# whether\nkept=yes\nown=1\n[c]\nx=y\n");
  EXPECT_EQ(upgrade(input, output), "");
  EXPECT_EQ(without_empty_lines(read_file(output)),
            "[a]\n# whether\nkept=no\nown=1\nraw=\" x\\s;\\\\ \n"
            "[c]\nx=y\n[b]\nnew=1\nnew[de]=2\n");
}

TEST_F(UpgradeTest, input_that_is_not_there) {
  const std::string output = write_file("out", "[a]\nx=y\n");
  EXPECT_EQ(upgrade(path_of("none"), output), "Unable to open input file: " + path_of("none"));
  EXPECT_EQ(read_file(output), "[a]\nx=y\n");
}

TEST_F(UpgradeTest, output_that_is_not_there_is_told_by_the_input) {
  const std::string input = write_file("in", "[a]\nx=y\n");
  EXPECT_EQ(upgrade(input, path_of("none")), "Unable to open output file: " + input);
  EXPECT_FALSE(g_file_test(path_of("none").c_str(), G_FILE_TEST_EXISTS));
}

TEST_F(UpgradeTest, files_that_are_no_key_files) {
  const std::string good = write_file("good", "[a]\nx=y\n");
  const std::string bad = write_file("bad", "nothing\n");
  EXPECT_EQ(upgrade(bad, good), "Unable to open input file: " + bad);
  EXPECT_EQ(upgrade(good, bad), "Unable to open output file: " + good);
}

TEST_F(UpgradeTest, result_that_cannot_be_stored) {
  const std::string input = write_file("in", "[a]\nx=new\n");
  const std::string output = write_file("out", "[a]\nx=old\n");
  {
    const FileSizeLimit no_room(0);
    EXPECT_FALSE(param_upgrade(input.c_str(), output.c_str(), nullptr));
  }
  EXPECT_EQ(read_file(output), "[a]\nx=old\n");
  EXPECT_TRUE(log().took_containing(
      kLogLevelUser, "param_upgrade@793: failed to save key file: " + output + ", error: "));
  EXPECT_TRUE(
      log().took(kLogLevelUser, "param_upgrade@799: save operation failed! [" + output + "]\n"));
  EXPECT_TRUE(log().empty());
}

}  // namespace
