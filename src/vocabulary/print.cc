// Prints the vocabulary: as Markdown for the manual page, as a RELAX NG schema for editors, or the
// worked examples for the tests. What it prints is committed; a test tells when it is out of date.
#include <cstdio>
#include <string>

#include "vocabulary/vocabulary.h"

namespace {

using vocabulary::Attribute;
using vocabulary::Element;
using vocabulary::Type;

std::string text(std::string_view view) {
  return std::string(view);
}

std::string joined(std::string_view words) {
  std::string list;
  for (const char letter : words) {
    list += letter == ' ' ? std::string(", ") : std::string(1, letter);
  }
  return list;
}

// --- Markdown ---

// Words with underscores would count as emphasis.
std::string plain(std::string_view words) {
  std::string plain;
  for (const char letter : words) {
    plain += (letter == '_' || letter == '*' || letter == '<' ? "\\" : "") + std::string(1, letter);
  }
  return plain;
}

std::string type_of(const Attribute &attribute) {
  return attribute.type == Type::kWord ? "one of " + plain(joined(attribute.words))
                                       : text(vocabulary::type_in_words(attribute.type));
}

void print_attributes(std::span<const Attribute> attributes) {
  for (const auto &attribute : attributes) {
    const std::string fallback =
        attribute.required ? "required" : "default: " + plain(attribute.fallback);
    std::printf("- **%s** (%s; %s): %s\n", plain(attribute.name).c_str(),
                type_of(attribute).c_str(), fallback.c_str(), plain(attribute.effect).c_str());
  }
  std::puts("");
}

void print_element(const Element &element, const char *level) {
  std::printf("%s \\<%s\\>\n\n%s\n\n", level, plain(element.name).c_str(),
              plain(element.effect).c_str());
  if (element.any_attribute) {
    std::puts("Flags that mean something to the daemon:\n");
    print_attributes(vocabulary::flags());
  } else {
    print_attributes(element.attributes);
  }
}

void print_code(std::string_view code) {
  std::printf("```xml\n%s\n```\n\n", text(code).c_str());
}

void print_markdown() {
  std::puts("# ELEMENTS\n");
  for (const auto &element : vocabulary::elements()) {
    print_element(element, "##");
  }
  std::puts("# BACKENDS\n");
  for (const auto &backend : vocabulary::backends()) {
    std::printf("## %s\n\n%s For ports of the type %s.\n\n", text(backend.name).c_str(),
                plain(backend.effect).c_str(), plain(joined(backend.port_types)).c_str());
    for (const auto &section : backend.sections) {
      std::printf("**\\<%s\\>**: %s\n\n", plain(section.name).c_str(),
                  plain(section.effect).c_str());
      print_attributes(section.attributes);
    }
    print_code(backend.example);
  }
}

void print_settings() {
  std::puts("# KEYS\n");
  for (const auto &setting : vocabulary::settings()) {
    const Attribute attribute = {.name = setting.key,
                                 .type = setting.type,
                                 .fallback = setting.fallback,
                                 .effect = setting.effect,
                                 .words = setting.words};
    const std::string where = setting.port_types.empty()
                                  ? "ports that can be supervised"
                                  : "ports of the type " + plain(joined(setting.port_types));
    std::printf("- **%s** (%s; default: %s; %s): %s\n", plain(setting.key).c_str(),
                type_of(attribute).c_str(), plain(setting.fallback).c_str(), where.c_str(),
                plain(setting.effect).c_str());
  }
}

// --- RELAX NG ---

const char *pattern_of(Type type) {
  switch (type) {
    case Type::kSwitch:
      return "[Tt][Rr][Uu][Ee]|[Ff][Aa][Ll][Ss][Ee]";
    case Type::kStrictSwitch:
      return "true|false";
    case Type::kNumber:
      return "-?[0-9]+";
    case Type::kUnsigned:
      return "[0-9]+";
    case Type::kAnyBase:
      return "0[xX][0-9A-Fa-f]+|[0-9]+";
    case Type::kHexadecimal:
      return "(0[xX])?[0-9A-Fa-f]+";
    case Type::kText:
    case Type::kWord:
      break;
  }
  return nullptr;
}

std::string value_schema(const Attribute &attribute) {
  if (const char *pattern = pattern_of(attribute.type)) {
    return std::string(R"(<data type="string"><param name="pattern">)") + pattern +
           "</param></data>";
  }
  if (attribute.type == Type::kText) {
    return attribute.required ? R"(<data type="string"><param name="minLength">1</param></data>)"
                              : "<text/>";
  }
  std::string choice = "<choice>";
  std::string word;
  for (const char letter : text(attribute.words) + " ") {
    if (letter == ' ') {
      choice += "<value>" + word + "</value>";
      word.clear();
    } else {
      word += letter;
    }
  }
  return choice + "</choice>";
}

std::string escaped(std::string_view words) {
  std::string escaped;
  for (const char letter : words) {
    escaped += letter == '<' ? "&lt;" : letter == '&' ? "&amp;" : std::string(1, letter);
  }
  return escaped;
}

void print_attribute_schema(const Attribute &attribute, const char *indent) {
  const std::string inner = "<attribute name=\"" + text(attribute.name) + "\"><a:documentation>" +
                            escaped(attribute.effect) + "</a:documentation>" +
                            value_schema(attribute) + "</attribute>";
  std::printf("%s%s\n", indent,
              attribute.required ? inner.c_str() : ("<optional>" + inner + "</optional>").c_str());
}

void print_attribute_schemas(std::span<const Attribute> attributes, const char *indent) {
  for (const auto &attribute : attributes) {
    print_attribute_schema(attribute, indent);
  }
}

// Any flag may be given; those that the daemon knows are offered by editors.
void print_flags_schema() {
  std::string known;
  for (const auto &flag : vocabulary::flags()) {
    print_attribute_schema(flag, "      ");
    known += "<name>" + text(flag.name) + "</name>";
  }
  std::printf(
      "      <zeroOrMore><attribute><anyName><except>%s</except></anyName>"
      "<data type=\"string\"><param name=\"pattern\">%s</param></data></attribute></zeroOrMore>\n",
      known.c_str(), pattern_of(Type::kSwitch));
}

void print_backend_schema(const vocabulary::Backend &backend) {
  std::printf("      <group>\n        <attribute name=\"name\"><value>%s</value></attribute>\n",
              text(backend.name).c_str());
  if (backend.any_section) {
    std::puts(
        "        <zeroOrMore><attribute><anyName><except><name>name</name></except></anyName>"
        "</attribute></zeroOrMore>\n        <zeroOrMore><ref name=\"anything\"/></zeroOrMore>");
  } else if (!backend.sections.empty()) {
    std::puts("        <zeroOrMore><choice>");
    for (const auto &section : backend.sections) {
      std::printf("          <element name=\"%s\">\n", text(section.name).c_str());
      print_attribute_schemas(section.attributes, "            ");
      std::puts("            <empty/>\n          </element>");
    }
    std::puts("        </choice></zeroOrMore>");
  } else {
    std::puts("        <empty/>");
  }
  std::puts("      </group>");
}

void print_content_schema(const Element &element) {
  if (element.name == "port") {
    std::puts(
        "      <interleave>\n        <ref name=\"port_type\"/>\n        <ref name=\"port_no\"/>\n"
        "        <oneOrMore><ref name=\"properties\"/></oneOrMore>\n"
        "        <zeroOrMore><ref name=\"param_default_name\"/></zeroOrMore>\n"
        "        <ref name=\"backend\"/>\n        <zeroOrMore><ref name=\"event\"/></zeroOrMore>\n"
        "      </interleave>");
  } else if (element.name == "event") {
    std::puts("      <zeroOrMore><ref name=\"keyvalue\"/></zeroOrMore>");
  } else {
    std::puts("      <empty/>");
  }
}

void print_element_schema(const Element &element) {
  const std::string name = text(element.name);
  std::printf("  <define name=\"%s\">\n    <element name=\"%s\">\n", name.c_str(), name.c_str());
  if (element.name == "backend") {
    std::puts("      <choice>");
    for (const auto &backend : vocabulary::backends()) {
      print_backend_schema(backend);
    }
    std::puts("      </choice>");
  } else {
    if (element.any_attribute) {
      print_flags_schema();
    } else {
      print_attribute_schemas(element.attributes, "      ");
    }
    print_content_schema(element);
  }
  std::puts("    </element>\n  </define>");
}

void print_schema() {
  std::puts(
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
      "<!-- Hardware descriptions of portd, for editors. \"portctl check\" finds more: what "
      "depends "
      "on the type of a port,\n     the order of attributes, or other ports. Made from the "
      "vocabulary: do not edit. -->\n"
      "<grammar xmlns=\"http://relaxng.org/ns/structure/1.0\"\n"
      "         xmlns:a=\"http://relaxng.org/ns/compatibility/annotations/1.0\"\n"
      "         datatypeLibrary=\"http://www.w3.org/2001/XMLSchema-datatypes\">\n"
      "  <start>\n    <element>\n      <anyName/>\n"
      "      <zeroOrMore><choice><ref name=\"port\"/><ref name=\"first_virtual_input\"/></choice>"
      "</zeroOrMore>\n    </element>\n  </start>\n"
      "  <define name=\"anything\">\n    <element>\n      <anyName/>\n"
      "      <zeroOrMore><choice><attribute><anyName/></attribute><ref name=\"anything\"/></choice>"
      "</zeroOrMore>\n    </element>\n  </define>");
  for (const auto &element : vocabulary::elements()) {
    print_element_schema(element);
  }
  std::puts("</grammar>");
}

// --- Examples ---

// A whole description with one port a backend; the types are the first that each serves.
void print_examples() {
  std::puts("<ports>");
  int number = 0;
  for (const auto &backend : vocabulary::backends()) {
    const bool output = backend.name == "gpio" || backend.name == "virtual";
    std::printf(
        "<port name=\"%s\">\n<port_type type=\"%s\"/>\n<port_no nbr=\"%d\"/>\n"
        "<properties ioport=\"true\"/>\n%s\n</port>\n",
        text(backend.name).c_str(), output ? "output" : "input", number++,
        text(backend.example).c_str());
  }
  std::printf("<first_virtual_input nbr=\"%d\"/>\n</ports>\n", number);
}

}  // namespace

int main(int argc, char **argv) {
  const std::string_view what = argc == 2 ? argv[1] : "";
  if (what == "markdown") {
    print_markdown();
  } else if (what == "settings") {
    print_settings();
  } else if (what == "schema") {
    print_schema();
  } else if (what == "examples") {
    print_examples();
  } else {
    std::fprintf(stderr, "usage: %s markdown|settings|schema|examples\n", argv[0]);
    return 2;
  }
  return 0;
}
