#include <gtest/gtest.h>

#include "owners.h"

namespace {

constexpr const char *kNotUtf8 = "\xff\xfe";

struct Text {
  const char *text;
  gint type;
  bool fits;
};

class TextConversion : public testing::TestWithParam<Text> {};

TEST_P(TextConversion, TakesOnlyWhatFitsTheType) {
  const auto &[text, type, fits] = GetParam();
  const DeclarationPtr declaration(event_declaration_new());
  ASSERT_TRUE(event_declaration_add_key(declaration.get(), "key", type));
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  EXPECT_EQ(inspectable_set_value_as_string(inspectable, "key", type, text), fits ? TRUE : FALSE);
}

constexpr Text kTexts[] = {
    {"0", EVENT_KEY_INT, true},
    {"-2147483648", EVENT_KEY_INT, true},
    {"2147483647", EVENT_KEY_INT, true},
    {"2147483648", EVENT_KEY_INT, false},
    {"-2147483649", EVENT_KEY_INT, false},
    {"", EVENT_KEY_INT, false},
    {"1x", EVENT_KEY_INT, false},
    {" 1", EVENT_KEY_INT, false},
    {"0x10", EVENT_KEY_INT, false},
    {nullptr, EVENT_KEY_INT, false},
    {"0", EVENT_KEY_BOOL, true},
    {"1", EVENT_KEY_BOOL, true},
    {"true", EVENT_KEY_BOOL, true},
    {"false", EVENT_KEY_BOOL, true},
    {"yes", EVENT_KEY_BOOL, false},
    {"2", EVENT_KEY_BOOL, false},
    {"", EVENT_KEY_BOOL, false},
    {nullptr, EVENT_KEY_BOOL, false},
    {"1", EVENT_KEY_DOUBLE, true},
    {"-1.5e3", EVENT_KEY_DOUBLE, true},
    {"1,5", EVENT_KEY_DOUBLE, false},
    {"1e999", EVENT_KEY_DOUBLE, false},
    {"nan", EVENT_KEY_DOUBLE, false},
    {"0x1p3", EVENT_KEY_DOUBLE, false},
    {" 1", EVENT_KEY_DOUBLE, false},
    {"-", EVENT_KEY_DOUBLE, false},
    {"1-1", EVENT_KEY_DOUBLE, false},
    {"", EVENT_KEY_DOUBLE, false},
    {nullptr, EVENT_KEY_DOUBLE, false},
    {"", EVENT_KEY_STRING, true},
    {"T\xc3\xbcr", EVENT_KEY_STRING, true},
    {kNotUtf8, EVENT_KEY_STRING, false},
    {nullptr, EVENT_KEY_STRING, false},
};
INSTANTIATE_TEST_SUITE_P(Texts, TextConversion, testing::ValuesIn(kTexts));

TEST(EventDeclaration, RefusesATypeOfKeyThatDoesNotExist) {
  const DeclarationPtr declaration(event_declaration_new());
  for (const gint type : {-1, 0, 5}) {
    EXPECT_FALSE(event_declaration_add_key(declaration.get(), "key", type)) << type;
    EXPECT_FALSE(inspectable_set_value_as_string(
        event_declaration_get_inspectable(declaration.get()), "key", type, "1"))
        << type;
  }
}

TEST(EventDeclaration, HasAKeyOnce) {
  const DeclarationPtr declaration(event_declaration_new());
  EXPECT_TRUE(event_declaration_add_key(declaration.get(), "key", EVENT_KEY_INT));
  EXPECT_FALSE(event_declaration_add_key(declaration.get(), "key", EVENT_KEY_INT));
  EXPECT_FALSE(event_declaration_add_key(declaration.get(), "key", EVENT_KEY_BOOL));
}

TEST(EventDeclaration, BuiltKeyByKeyKnowsNoOtherKeys) {
  const DeclarationPtr declaration = port_declaration(1);
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  EXPECT_FALSE(inspectable_set_int(inspectable, "other", 1));
  EXPECT_FALSE(inspectable_set_nice_names(inspectable, "other", "Other", "One"));
  EXPECT_FALSE(event_declaration_set_nice_names(declaration.get(), "other", "Other", "One"));
  EXPECT_FALSE(event_declaration_set_namespace(declaration.get(), "other", "tns1"));
  EXPECT_FALSE(event_declaration_set_key_tag(declaration.get(), "other", "onvif-data"));
  EXPECT_FALSE(event_declaration_set_property(declaration.get(), "other", nullptr, nullptr));
  EXPECT_FALSE(event_declaration_is_property(declaration.get()));
}

TEST(EventDeclaration, SettersWantTheTypeOfTheKey) {
  const DeclarationPtr declaration(event_declaration_new());
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  event_declaration_add_key(declaration.get(), "i", EVENT_KEY_INT);
  event_declaration_add_key(declaration.get(), "b", EVENT_KEY_BOOL);
  event_declaration_add_key(declaration.get(), "d", EVENT_KEY_DOUBLE);
  event_declaration_add_key(declaration.get(), "s", EVENT_KEY_STRING);
  for (const char *key : {"i", "b", "d", "s"}) {
    EXPECT_EQ(inspectable_set_int(inspectable, key, 1) != FALSE, *key == 'i') << key;
    EXPECT_EQ(inspectable_set_bool(inspectable, key, TRUE) != FALSE, *key == 'b') << key;
    EXPECT_EQ(inspectable_set_double(inspectable, key, 1.0) != FALSE, *key == 'd') << key;
    EXPECT_EQ(inspectable_set_string(inspectable, key, "1") != FALSE, *key == 's') << key;
  }
  EXPECT_FALSE(inspectable_set_value_as_string(inspectable, "s", EVENT_KEY_INT, "1"));
  EXPECT_FALSE(inspectable_set_double(inspectable, "d", G_MAXDOUBLE * 2));
}

TEST(EventDeclaration, OfATypeAddsTheKeysThatAreSetOrDescribed) {
  const DeclarationPtr declaration(event_declaration_new_from_type("com.kelv.Event.Some"));
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  EXPECT_FALSE(event_declaration_is_property(declaration.get()));
  EXPECT_TRUE(inspectable_set_nice_names(inspectable, "state", "State", nullptr));
  EXPECT_TRUE(inspectable_set_value_as_string(inspectable, "port", EVENT_KEY_INT, "7"));
  EXPECT_FALSE(inspectable_set_value_as_string(inspectable, "port", EVENT_KEY_STRING, "seven"));
  EXPECT_TRUE(event_declaration_set_property(declaration.get(), "state", nullptr, nullptr));
  EXPECT_TRUE(event_declaration_is_property(declaration.get()));
  EXPECT_TRUE(event_declaration_add_key(declaration.get(), "state", EVENT_KEY_BOOL));
  EXPECT_FALSE(inspectable_set_int(inspectable, "state", 1));
}

TEST(EventDeclaration, AFailedConversionAddsNoKey) {
  const DeclarationPtr declaration(event_declaration_new_from_type("com.kelv.Event.Some"));
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  EXPECT_FALSE(inspectable_set_value_as_string(inspectable, "key", EVENT_KEY_INT, "one"));
  EXPECT_TRUE(inspectable_set_value_as_string(inspectable, "key", EVENT_KEY_STRING, "one"));
}

TEST(EventDeclaration, RefusesTextThatIsNotUtf8) {
  const DeclarationPtr declaration(event_declaration_new_from_type("com.kelv.Event.Some"));
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  EXPECT_EQ(event_declaration_new_from_type(kNotUtf8), nullptr);
  EXPECT_FALSE(event_declaration_add_key(declaration.get(), kNotUtf8, EVENT_KEY_INT));
  EXPECT_FALSE(inspectable_set_int(inspectable, kNotUtf8, 1));
  EXPECT_FALSE(inspectable_set_string(inspectable, "key", kNotUtf8));
  EXPECT_FALSE(inspectable_set_nice_names(inspectable, "key", kNotUtf8, nullptr));
  EXPECT_FALSE(inspectable_set_nice_names(inspectable, "key", nullptr, kNotUtf8));
  EXPECT_FALSE(event_declaration_set_namespace(declaration.get(), "key", kNotUtf8));
  EXPECT_FALSE(event_declaration_set_key_tag(declaration.get(), "key", kNotUtf8));
  EXPECT_FALSE(event_declaration_set_property(declaration.get(), kNotUtf8, nullptr, nullptr));
}

TEST(EventDeclaration, RefusesWhatIsMissing) {
  const DeclarationPtr declaration(event_declaration_new());
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  EXPECT_EQ(event_declaration_new_from_type(nullptr), nullptr);
  EXPECT_EQ(event_declaration_new_from_type(""), nullptr);
  EXPECT_EQ(event_declaration_get_inspectable(nullptr), nullptr);
  EXPECT_FALSE(event_declaration_is_property(nullptr));
  EXPECT_FALSE(event_declaration_add_key(nullptr, "key", EVENT_KEY_INT));
  EXPECT_FALSE(event_declaration_add_key(declaration.get(), nullptr, EVENT_KEY_INT));
  EXPECT_FALSE(event_declaration_add_key(declaration.get(), "", EVENT_KEY_INT));
  EXPECT_FALSE(event_declaration_set_nice_names(nullptr, "key", "Key", "Value"));
  EXPECT_FALSE(event_declaration_set_namespace(declaration.get(), "key", nullptr));
  EXPECT_FALSE(event_declaration_set_namespace(nullptr, "key", "tns1"));
  EXPECT_FALSE(event_declaration_set_key_tag(declaration.get(), "key", nullptr));
  EXPECT_FALSE(event_declaration_set_key_tag(nullptr, "key", "tag"));
  EXPECT_FALSE(event_declaration_set_property(nullptr, "key", nullptr, nullptr));
  EXPECT_FALSE(event_declaration_set_property(declaration.get(), nullptr, nullptr, nullptr));
  EXPECT_FALSE(inspectable_set_int(nullptr, "key", 1));
  EXPECT_FALSE(inspectable_set_int(inspectable, nullptr, 1));
  EXPECT_FALSE(inspectable_set_string(inspectable, "key", nullptr));
  EXPECT_FALSE(inspectable_set_nice_names(nullptr, "key", "Key", "Value"));
  event_declaration_free(nullptr);
}

}  // namespace
