#include "legacy/documents.h"

#include "fixture.h"

namespace {

const std::vector<LegacyPort> kPorts = {{0, PORT_INPUT}, {1, PORT_OUTPUT}, {2, PORT_CONFIGURABLE}};

std::string golden(const char *name) {
  return read_file(std::string(GOLDEN_DIR) + "/" + name);
}

TEST(LegacyDocuments, registry_lists_every_port) {
  EXPECT_EQ(legacy_registry_document(kPorts), golden("registry.conf"));
}

TEST(LegacyDocuments, registry_is_never_empty) {
  EXPECT_EQ(legacy_registry_document({}), golden("registry-no-ports.conf"));
}

TEST(LegacyDocuments, mapping_has_the_groups_by_kind_and_then_by_number) {
  EXPECT_EQ(legacy_mapping_document(kPorts), golden("mapping.xml"));
}

TEST(LegacyDocuments, mapping_without_ports_has_the_counts) {
  EXPECT_EQ(legacy_mapping_document({}), golden("mapping-no-ports.xml"));
}

TEST(LegacyDocuments, port_numbers_stand_in_every_place) {
  std::string expected = golden("registry-no-ports.conf");
  const std::string object = "IOPort/0\">";
  expected.replace(expected.find(object), object.size(), "IOPort/2147483647\">");
  EXPECT_EQ(legacy_registry_document({{2147483647, PORT_INPUT}}), expected);
  const std::string mapping = legacy_mapping_document({{2147483647, PORT_INPUT}});
  EXPECT_NE(mapping.find("\"root.IOPort.I2147483647.Input\""), std::string::npos);
}

}  // namespace
