// The command check: hardware descriptions, and a settings file for them.
#include <algorithm>
#include <cstdio>

#include "base/glib-ptr.h"
#include "portctl/check/description.h"
#include "portctl/check/settings.h"
#include "portctl/json.h"
#include "portctl/session.h"
#include "portctl/text.h"

namespace {

std::string read_file(const std::string &path) {
  char *contents = nullptr;
  gsize length = 0;
  Error error;
  // Reading a pipe or a device could go on for ever.
  if (!g_file_test(path.c_str(), G_FILE_TEST_IS_REGULAR)) {
    fail(STATUS_USAGE, visible(path) + " is no file");
  }
  if (!g_file_get_contents(path.c_str(), &contents, &length, error.out())) {
    fail(STATUS_USAGE, visible(error.message()));
  }
  const GCharPtr owned(contents);
  return {contents, length};
}

// A folder stands for the files in it: the daemon reads every one. It does so in no particular
// order.
std::vector<std::string> expanded(const std::string &path) {
  const GDirPtr folder(g_dir_open(path.c_str(), 0, nullptr));
  if (!folder) {
    return {path};
  }
  std::vector<std::string> paths;
  while (const char *name = g_dir_read_name(folder.get())) {
    paths.push_back(path + (path.ends_with('/') ? "" : "/") + name);
  }
  std::sort(paths.begin(), paths.end());
  return paths;
}

// What editors and package managers leave behind is read like any other file.
void check_name(const std::string &path, Findings &findings) {
  const std::string name = path.substr(path.rfind('/') + 1);
  for (const char *ending : {"~", ".bak", ".orig", ".swp", ".tmp", ".dpkg-old", ".dpkg-dist",
                             ".dpkg-new", ".rpmsave", ".rpmnew"}) {
    if (name.ends_with(ending)) {
      findings.error({path, 1, 1},
                     "this looks like a copy that an editor or a package manager left, "
                     "and the daemon reads every file of its folder: move it away");
      return;
    }
  }
  if (name.starts_with(".") || name.starts_with("#")) {
    findings.error({path, 1, 1}, "the daemon reads hidden files of its folder too: move it away");
  }
}

std::string finding_json(const Finding &finding) {
  return JsonObject()
      .add("file", finding.place.file)
      .add("line", finding.place.line)
      .add("column", finding.place.column)
      .add("severity", finding.error ? "error" : "warning")
      .add("message", finding.text)
      .text();
}

void print(const Session &session, const Finding &finding) {
  const std::string place = visible(finding.place.file) + ":" + std::to_string(finding.place.line) +
                            ":" + std::to_string(finding.place.column) + ":";
  std::printf("%s %s %s\n", styled(place, Style::kBold, session.colours).c_str(),
              styled(finding.error ? "error:" : "warning:",
                     finding.error ? Style::kBad : Style::kWarn, session.colours)
                  .c_str(),
              visible(finding.text).c_str());
}

int report(const Session &session, const Findings &findings) {
  JsonArray array;
  bool bad = false;
  for (const auto &finding : findings.sorted()) {
    bad = bad || finding.error || session.options.strict;
    array.add_raw(finding_json(finding));
    if (!session.options.json) {
      print(session, finding);
    }
  }
  if (session.options.json) {
    std::printf("%s\n", array.text().c_str());
  }
  return bad ? STATUS_REFUSED : STATUS_OK;
}

}  // namespace

int check_command(Session &session) {
  Findings findings;
  DescriptionChecker checker(findings);
  for (const auto &word : session.words) {
    for (const auto &path : expanded(word)) {
      check_name(path, findings);
      checker.read(path, read_file(path));
    }
  }
  checker.finish();
  if (!session.options.settings.empty()) {
    check_settings(session.options.settings, read_file(session.options.settings), checker.ports(),
                   findings);
  }
  return report(session, findings);
}
