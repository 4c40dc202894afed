#include "portctl/check/document.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "base/glib-ptr.h"
#include "portctl/text.h"

namespace {

bool is_blank(char character) {
  return std::strchr(" \t\r\n", character) != nullptr && character != '\0';
}

// Follows the parser through the text: the parser tells what there is, this finds out where.
class Locator {
 public:
  Locator(std::string file, std::string_view text) : text_(text), seen_{std::move(file), 1, 1} {}

  // The place of the next start tag, and of each of its attributes.
  void locate(DocumentElement &element) {
    skip_to_start_tag();
    element.place = place();
    while (!at_end() && !is_blank(now()) && now() != '>' && now() != '/') {
      ++at_;
    }
    for (auto &attribute : element.attributes) {
      locate(attribute);
    }
  }

  Place locate_text() {
    skip_blanks();
    while (!at_end() && now() == '>') {  // the end of the tag that was located last
      ++at_;
      skip_blanks();
    }
    while (!at_end() && now() == '<') {
      skip_markup();
      skip_blanks();
    }
    return place();
  }

 private:
  bool at_end() const { return at_ >= text_.size(); }
  char now() const { return text_[at_]; }
  bool stands(std::string_view what) const { return text_.substr(at_).starts_with(what); }

  void skip_blanks() {
    while (!at_end() && is_blank(now())) {
      ++at_;
    }
  }

  void skip_past(std::string_view what) {
    const auto found = text_.find(what, at_);
    at_ = found == std::string_view::npos ? text_.size() : found + what.size();
  }

  void skip_markup() {
    if (stands("<!--")) {
      skip_past("-->");
    } else if (stands("<![CDATA[")) {
      skip_past("]]>");
    } else if (stands("<?")) {
      skip_past("?>");
    } else {
      skip_past(">");
    }
  }

  void skip_to_start_tag() {
    for (;;) {
      at_ = std::min(text_.find('<', at_), text_.size());
      if (at_end() || !(stands("<!") || stands("<?") || stands("</"))) {
        return;
      }
      skip_markup();
    }
  }

  void locate(DocumentAttribute &attribute) {
    skip_blanks();
    attribute.place = place();
    const auto opening = text_.find_first_of("\"'", at_);
    if (opening == std::string_view::npos) {
      return;
    }
    const auto closing = text_.find(text_[opening], opening + 1);
    at_ = closing == std::string_view::npos ? text_.size() : closing + 1;
  }

  // Counts on from the place asked for last.
  Place place() {
    for (; counted_ < std::min(at_, text_.size()); ++counted_) {
      const auto byte = static_cast<unsigned char>(text_[counted_]);
      if (byte == '\n') {
        ++seen_.line;
        seen_.column = 1;
      } else if ((byte & 0xC0) != 0x80) {
        ++seen_.column;
      }
    }
    return seen_;
  }

  std::string_view text_;
  std::size_t at_ = 0;
  std::size_t counted_ = 0;
  Place seen_;
};

struct Reading {
  Locator locator;
  DocumentHandler &handler;
};

void on_start(GMarkupParseContext * /*context*/, const char *name, const char **names,
              const char **values, gpointer data, GError ** /*error*/) {
  auto &reading = *static_cast<Reading *>(data);
  DocumentElement element = {.name = name, .attributes = {}, .place = {}};
  for (; *names; ++names, ++values) {
    element.attributes.push_back({*names, *values, {}});
  }
  reading.locator.locate(element);
  reading.handler.begin(element);
}

void on_end(GMarkupParseContext * /*context*/, const char * /*name*/, gpointer data,
            GError ** /*error*/) {
  static_cast<Reading *>(data)->handler.end();
}

void on_text(GMarkupParseContext * /*context*/, const char *text, gsize length, gpointer data,
             GError ** /*error*/) {
  if (!std::all_of(text, text + length, is_blank)) {
    auto &reading = *static_cast<Reading *>(data);
    reading.handler.text(reading.locator.locate_text());
  }
}

constexpr GMarkupParser kParser = {on_start, on_end, on_text, nullptr, nullptr};

// "Error on line 3 char 8: reason", which most messages of the parser look like.
void report(const std::string &file, const char *message, GMarkupParseContext *context,
            Findings &findings) {
  Place place = {file, 1, 1};
  int length = 0;
  if (std::sscanf(message, "Error on line %d char %d: %n", &place.line, &place.column, &length) <
          2 ||
      length == 0) {
    g_markup_parse_context_get_position(context, &place.line, &place.column);
    length = 0;
  }
  place.line = std::max(place.line, 1);
  place.column = std::max(place.column, 1);
  findings.error(place, "malformed: " + visible(message + length) +
                            " (the daemon ignores everything from here on)");
}

bool parse(Reading &reading, std::string_view text, const std::string &file, Findings &findings) {
  const GMarkupContextPtr context(
      g_markup_parse_context_new(&kParser, static_cast<GMarkupParseFlags>(0), &reading, nullptr));
  Error error;
  const bool done = g_markup_parse_context_parse(context.get(), text.data(),
                                                 static_cast<gssize>(text.size()), error.out()) &&
                    g_markup_parse_context_end_parse(context.get(), error.out());
  if (!done) {
    report(file, error.message(), context.get(), findings);
  }
  return done;
}

// Encodings that the parser can't read are told by name: its own words would puzzle.
bool check_encoding(const std::string &file, const std::string &text, Findings &findings) {
  const Place start = {file, 1, 1};
  if (text.starts_with("\xEF\xBB\xBF")) {
    findings.error(start,
                   "the file begins with a byte order mark, which the daemon does not take: "
                   "save it as UTF-8 without one");
    return false;
  }
  if (text.starts_with("\xFF\xFE") || text.starts_with("\xFE\xFF") ||
      text.find('\0') != std::string::npos) {
    findings.error(start, "the file is UTF-16 or binary: save it as UTF-8");
    return false;
  }
  if (text.find_first_not_of(" \t\r\n") == std::string::npos) {
    findings.error(start, "the file is empty: it needs at least one element, such as <ports/>");
    return false;
  }
  return true;
}

// The parser takes every document for UTF-8, whatever it declares.
void check_declaration(const std::string &file, const std::string &text, Findings &findings) {
  const auto end = text.find("?>");
  const auto encoding = text.find("encoding=");
  if (!text.starts_with("<?xml") || encoding == std::string::npos || encoding > end) {
    return;
  }
  const std::string name = text.substr(encoding + 10, 5);
  if (g_ascii_strncasecmp(name.c_str(), "UTF-8", 5) != 0) {
    findings.warning({file, 1, static_cast<int>(encoding) + 1},
                     "the daemon reads the file as UTF-8, whatever is declared: save it as UTF-8");
  }
}

}  // namespace

const DocumentAttribute *DocumentElement::find(std::string_view wanted) const {
  const auto found = std::find_if(attributes.begin(), attributes.end(),
                                  [&](const auto &attribute) { return attribute.name == wanted; });
  return found == attributes.end() ? nullptr : &*found;
}

void read_document(const std::string &file, const std::string &text, DocumentHandler &handler,
                   Findings &findings) {
  if (!check_encoding(file, text, findings)) {
    return;
  }
  check_declaration(file, text, findings);
  Reading reading = {Locator(file, text), handler};
  parse(reading, text, file, findings);
}
