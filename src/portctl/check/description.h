// Hardware descriptions held against the vocabulary, and the ports of all of them against each
// other.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "portctl/check/document.h"
#include "vocabulary/vocabulary.h"

struct RangeMark {
  std::string state;
  std::int64_t lower;
  std::int64_t upper;
  Place place;
};

struct DescribedPort {
  std::string id;
  std::string type;  // as in port_type; empty when there is none
  Place place;
  std::optional<Place> type_place;
  std::optional<std::int64_t> number;
  std::optional<Place> number_place;
  bool by_hardware = false;  // only where the hardware id fits
  bool named_first = false;  // a later one takes the place of an earlier one
  bool has_flag = false;     // one that makes clients or the daemon look at it
  bool port = false;
  bool has_event = false;
  bool input_named = false;
  bool output_named = false;
  const vocabulary::Backend *backend = nullptr;
  std::optional<Place> backend_place;
  std::map<std::string, Place> sections;
  std::vector<RangeMark> ranges;
  bool always_measured = false;  // can't be supervised by clients
};

// Read the files in the order in which the daemon does, then finish.
class DescriptionChecker : public DocumentHandler {
 public:
  explicit DescriptionChecker(Findings &findings) : findings_(findings) {}

  void read(const std::string &file, const std::string &text);
  // What only all files together tell.
  void finish();

  // Those that the daemon would have.
  const std::vector<DescribedPort> &ports() const { return ports_; }

  void begin(const DocumentElement &element) override;
  void end() override;
  void text(const Place &place) override;

 private:
  bool inside(std::string_view name) const;
  void check_place(const DocumentElement &element, const std::string &name);
  void apply(const DocumentElement &element, const std::string &name);
  void begin_port(const DocumentElement &element);
  void check_port_order(const DocumentElement &element);
  void replace_earlier(const DocumentElement &element);
  void apply_type(const DocumentElement &element);
  void apply_number(const DocumentElement &element);
  void apply_flags(const DocumentElement &element);
  void apply_backend(const DocumentElement &element);
  void check_event(const DocumentElement &element);
  void check_keyvalue(const DocumentElement &element);
  void check_section(const DocumentElement &element);
  void check_pin(const DocumentElement &element);
  void check_range(const DocumentElement &element);
  void check_spiadc_range(const DocumentElement &element);

  void finish_port(const DescribedPort &port);
  void check_needs(const DescribedPort &port);
  void check_numbers();
  void check_default_names();

  Findings &findings_;
  std::vector<std::string> open_;  // elements, by the names that are meant
  std::vector<DescribedPort> ports_;
  std::string event_;  // the declaration around what is read now
  std::size_t first_in_file_ = 0;
  bool has_first_virtual_input_ = false;
};
