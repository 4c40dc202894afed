#include "portctl/check/findings.h"

#include <algorithm>
#include <tuple>

#include "portctl/text.h"

namespace {

constexpr std::size_t kLongest = 64;  // a longer word is like none

std::string folded(std::string_view word) {
  std::string text(word);
  for (char &character : text) {
    character = character == '-' ? '_' : g_ascii_tolower(character);
  }
  return text;
}

// Letters to insert, remove or replace.
std::size_t distance(const std::string &a, const std::string &b) {
  std::vector<std::size_t> row(b.size() + 1);
  for (std::size_t j = 0; j <= b.size(); ++j) {
    row[j] = j;
  }
  for (std::size_t i = 1; i <= a.size(); ++i) {
    std::size_t diagonal = row[0];
    row[0] = i;
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const std::size_t above = row[j];
      row[j] = std::min({above + 1, row[j - 1] + 1, diagonal + (a[i - 1] == b[j - 1] ? 0 : 1)});
      diagonal = above;
    }
  }
  return row[b.size()];
}

}  // namespace

void Findings::add(const Place &place, bool is_error, std::string text) {
  if (std::find(files_.begin(), files_.end(), place.file) == files_.end()) {
    files_.push_back(place.file);
  }
  findings_.push_back({place, is_error, std::move(text)});
}

std::vector<Finding> Findings::sorted() const {
  std::vector<Finding> sorted = findings_;
  const auto key = [&](const Finding &finding) {
    const auto file = std::find(files_.begin(), files_.end(), finding.place.file);
    return std::tuple(file, finding.place.line, finding.place.column);
  };
  std::stable_sort(sorted.begin(), sorted.end(),
                   [&](const Finding &a, const Finding &b) { return key(a) < key(b); });
  return sorted;
}

std::string quoted(std::string_view text) {
  return "\"" + visible(text) + "\"";
}

std::string_view nearest(std::string_view word, const std::vector<std::string_view> &words) {
  std::string_view best;
  std::size_t least = std::max<std::size_t>(word.size() / 3, 1) + 1;
  if (word.size() > kLongest) {
    return best;
  }
  for (const auto candidate : words) {
    const std::size_t away = distance(folded(word), folded(candidate));
    if (away < least) {
      least = away;
      best = candidate;
    }
  }
  return best;
}

std::string suggestion(std::string_view word, const std::vector<std::string_view> &words) {
  const auto best = nearest(word, words);
  return best.empty() ? "" : "; did you mean " + quoted(best) + "?";
}
