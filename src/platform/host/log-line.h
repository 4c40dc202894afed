// How one log message reads on standard output.
#pragma once

#include <string>
#include <string_view>

struct LogMessage {
  int level = 0;  // of GLogLevelFlags, or one of the application's own above those
  std::string_view domain;
  std::string_view text;
};

// Whether the reader of this descriptor understands a level at the start of a line, as the journal
// does. The journal's service names the stream that it has opened for a process in the variable
// JOURNAL_STREAM, as "DEVICE:INODE"; a descriptor that was redirected later is another file.
bool is_journal_stream(int descriptor, const char *journal_stream);

// One line with its end, whatever the text holds. `with_priority`: the syslog priority comes first,
// as "<4>".
std::string log_line(const LogMessage &message, bool with_priority);
