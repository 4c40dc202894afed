// The values of an event that the hardware description describes key by key.
#pragma once

#include <list>
#include <string>

#include "platform/event.h"

struct IOPort;
struct IoEventKey;

// Whether the description can be populated: every key has a name, a value unless it only marks the
// property, and a type that goes with them. Says in the log what is wrong. Main thread.
bool event_keys_are_valid(const IOPort *port, const std::list<IoEventKey> &keys);

// Fills `inspectable` from the keys, in list order. While declaring (`sending` false) sets nice
// names and every value but that of property keys, and stores the name of the last property key in
// `property_key_out`, which is left alone when there is none. While sending sets property keys
// only. False, with a message, when a name or a value was refused.
//
// The keys must be sound: a key of an unknown type, or a state word of type "double", is a
// programming error that ends the daemon. Sending may come from any thread.
bool populate_event_values(IOPort *port, const std::list<IoEventKey> &keys,
                           Inspectable *inspectable, bool sending, std::string *property_key_out);
