// An XML document as the daemon's parser reads it, with the place of every element and attribute.
#pragma once

#include <string>
#include <vector>

#include "portctl/check/findings.h"

struct DocumentAttribute {
  std::string name;
  std::string value;
  Place place;
};

struct DocumentElement {
  std::string name;
  std::vector<DocumentAttribute> attributes;
  Place place;  // of the "<"

  const DocumentAttribute *find(std::string_view wanted) const;
};

class DocumentHandler {
 public:
  virtual ~DocumentHandler() = default;
  virtual void begin(const DocumentElement &element) = 0;
  virtual void end() = 0;                     // of the element begun last and not ended yet
  virtual void text(const Place &place) = 0;  // something between the tags that is not blank
};

// Reads until the end or the first malformed place, which is a finding.
void read_document(const std::string &file, const std::string &text, DocumentHandler &handler,
                   Findings &findings);
