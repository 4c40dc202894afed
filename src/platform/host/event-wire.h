// The event library's values as they go over the bus. Every result is floating.
#pragma once

#include <gio/gio.h>

#include "platform/host/event-keys.h"

// a{sv}: key -> value, for the keys whose type is known.
GVariant *keys_to_variant(const Inspectable &inspectable);

// a{sv}: an entry of List and of Declared.
GVariant *declaration_to_variant(const EventDeclaration &declaration);
