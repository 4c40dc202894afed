#include "platform/host/event-wire.h"

namespace {

GVariant *value_to_variant(const EventValue &value) {
  switch (value.type) {
    case EVENT_KEY_BOOL:
      return g_variant_new_boolean(value.boolean);
    case EVENT_KEY_DOUBLE:
      return g_variant_new_double(value.real);
    case EVENT_KEY_STRING:
      return g_variant_new_string(value.text.c_str());
    default:
      return g_variant_new_int32(value.integer);
  }
}

// a{ss}: key -> the text that `member` holds, for the keys that have it.
GVariant *texts_to_variant(const EventKeys &keys, std::optional<std::string> EventKey::*member) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a{ss}"));
  for (const auto &key : keys) {
    if (const auto &text = key.*member) {
      g_variant_builder_add(&builder, "{ss}", key.name.c_str(), text->c_str());
    }
  }
  return g_variant_builder_end(&builder);
}

GVariant *nice_names_to_variant(const EventKeys &keys) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a{s(ss)}"));
  for (const auto &key : keys) {
    if (key.nice_names) {
      g_variant_builder_add(&builder, "{s(ss)}", key.name.c_str(), key.nice_names->key.c_str(),
                            key.nice_names->value.c_str());
    }
  }
  return g_variant_builder_end(&builder);
}

}  // namespace

GVariant *keys_to_variant(const Inspectable &inspectable) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE_VARDICT);
  for (const auto &key : inspectable.keys) {
    if (key.type != kTypeUnknown) {
      g_variant_builder_add(&builder, "{sv}", key.name.c_str(),
                            value_to_variant(key.value.value_or(EventValue{.type = key.type})));
    }
  }
  return g_variant_builder_end(&builder);
}

GVariant *declaration_to_variant(const EventDeclaration &declaration) {
  const EventKeys &keys = declaration.inspectable.keys;
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE_VARDICT);
  const auto add = [&builder](const char *name, GVariant *value) {
    g_variant_builder_add(&builder, "{sv}", name, value);
  };
  add("type", g_variant_new_string(declaration.type.c_str()));
  add("keys", keys_to_variant(declaration.inspectable));
  add("namespaces", texts_to_variant(keys, &EventKey::name_space));
  add("tags", texts_to_variant(keys, &EventKey::tag));
  add("nice_names", nice_names_to_variant(keys));
  add("property", g_variant_new_string(declaration.property.c_str()));
  return g_variant_builder_end(&builder);
}
