#include "platform/host/event-wire.h"

#include <type_traits>

namespace {

GVariant *value_to_variant(const EventValue &value) {
  return std::visit(
      [](const auto &held) -> GVariant * {
        using Held = std::decay_t<decltype(held)>;
        if constexpr (std::is_same_v<Held, gint32>) {
          return g_variant_new_int32(held);
        } else if constexpr (std::is_same_v<Held, bool>) {
          return g_variant_new_boolean(held);
        } else if constexpr (std::is_same_v<Held, double>) {
          return g_variant_new_double(held);
        } else {
          return g_variant_new_string(held.c_str());
        }
      },
      value);
}

EventValue zero_of(gint type) {
  switch (type) {
    case EVENT_KEY_BOOL:
      return false;
    case EVENT_KEY_DOUBLE:
      return 0.0;
    case EVENT_KEY_STRING:
      return std::string();
    default:
      return gint32{0};
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
                            value_to_variant(key.value.value_or(zero_of(key.type))));
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
