// The device's event library: services make their events known as declarations, and send them.
//
// A declaration names the keys of an event, their types, and what the keys are called. Declared
// under a producer it gets an id, and events are sent on that id. A declaration with a property key
// stands for a state that can be asked for at any time, any other for a passing occurrence.
//
// What a producer declares and sends can be seen on the system bus, on the object
// "/com/kelv/Event/<producer name>" (a byte of the name that is no letter, digit or underscore
// appears there as an underscore and its two hexadecimal digits), interface
// "com.kelv.Event.Producer":
//   List () -> a(ua{sv})      the live declarations by id
//   Declared (u, a{sv})       a declaration has come; the same entries as in List
//   Undeclared (u)            a declaration has gone
//   Sent (u, a{sv})           every key of the declaration, with the values of this event
// A declaration has the entries "type" s ("" when it was built key by key), "keys" a{sv} (current
// values: i, b, d or s), "namespaces" a{ss}, "tags" a{ss}, "nice_names" a{s(ss)} (key -> nice name
// of the key, nice name of the value) and "property" s ("" when it has none).
//
// The library uses the process's shared connection to the system bus. It waits for none: without a
// bus everything below works as it does with one, unheard. The object appears as soon as there is a
// connection, which takes a running loop of the default main context; a declaration that was not
// announced for want of a bus is announced then.
//
// Bad arguments (a null pointer, an unknown id or key, a value that does not fit the type, text
// that is not UTF-8, an empty name) are refused by FALSE, 0, NULL or an error, never by a log
// message.
//
// Threads: the event_producer_ calls may come from any thread. A declaration or an event, with its
// inspectable, belongs to one thread at a time. Signals go out in the order of the calls.
#pragma once

#include <glib.h>

#ifdef __cplusplus
extern "C" {
#endif

// C reads this header too.
// NOLINTBEGIN(modernize-use-using)
typedef struct EventProducer EventProducer;
typedef struct EventDeclaration EventDeclaration;
typedef struct Event Event;
// The keys of a declaration or an event, for reading values into. Belongs to what it was got from.
typedef struct Inspectable Inspectable;

// The types of a key.
enum {
  EVENT_KEY_INT = 1,  // 32 bits, signed
  EVENT_KEY_BOOL = 2,
  EVENT_KEY_DOUBLE = 3,
  EVENT_KEY_STRING = 4
};

// Reads the current value of a property: sets it, and other keys of the declaration if it likes, in
// `values`. A key that it leaves alone keeps the value last set or sent.
//
// Called when a declaration is made, in the thread of event_producer_declare, and whenever the
// current values are asked for, in the main thread; with no lock of the library held, so it may
// take locks of its own and call back into the library. Sending never calls it. One that is under
// way when its declaration is withdrawn by another thread is not waited for: `user_data` should be
// a number, or live on.
typedef void (*EventPropertyCallback)(Inspectable *values, gpointer user_data);
// NOLINTEND(modernize-use-using)

// --- Producers ---

// The producer of that name. Producers of one name are one: each call is to be paired with
// event_producer_free. NULL: bad name. Never waits for the bus.
EventProducer *event_producer_new(const gchar *name);

// The same; `flags` and `reserved` are 0.
EventProducer *event_producer_new_full(const gchar *name, guint flags, guint reserved);

// Gives the producer up. With the last holder of the name its declarations and its object are
// withdrawn; no call on it may be under way then. NULL is allowed.
void event_producer_free(EventProducer *producer);

// Declares a copy of `declaration` (the caller's own may be changed, declared again or freed) and
// calls its property callback, so the caller must hold no lock that the callback takes. Returns the
// id, from 1 up, which no other declaration of the producer bears while this one lives, or 0: bad
// argument.
guint32 event_producer_declare(EventProducer *producer, const EventDeclaration *declaration);

// Withdraws a declaration. FALSE: no such id.
gboolean event_producer_undeclare(EventProducer *producer, guint32 id);

// A new event on a declaration, with no value set yet; free it with event_free. NULL: no such id.
Event *event_producer_prepare_event(EventProducer *producer, guint32 id);

// Sends an event: the values that were set in it become the current values of the declaration, and
// go out with the current values of the keys that were not set. May be repeated. Never waits and
// calls nothing back, so that it may be called under any lock.
//
// FALSE and an error of the domain G_IO_ERROR: G_IO_ERROR_NOT_FOUND (the declaration is gone),
// G_IO_ERROR_INVALID_ARGUMENT (not an event of this producer; a value of another type than that
// with which the key was sent before). That there is no bus to send on is no error.
gboolean event_producer_send_event(EventProducer *producer, const Event *event, GError **error);

// --- Declarations ---

// An empty declaration, to be filled key by key: only keys that were added can be set or described.
EventDeclaration *event_declaration_new(void);

// A declaration of a type that is named. A type that the library does not know starts without keys:
// each key that is set, described or made the property is then added, and the type of its first
// value, be it in an event, becomes the key's own. A key whose type is not known yet is left out of
// "keys" and of Sent. NULL: bad name.
EventDeclaration *event_declaration_new_from_type(const gchar *type);

// NULL is allowed. What was declared from it stays declared.
void event_declaration_free(EventDeclaration *declaration);

// The keys of the declaration, for setting values.
Inspectable *event_declaration_get_inspectable(EventDeclaration *declaration);

// Adds a key of a type (EVENT_KEY_...), with the value 0, FALSE or "". FALSE: bad argument, or the
// key is there with a type.
gboolean event_declaration_add_key(EventDeclaration *declaration, const gchar *key, gint type);

// What the key and its value are called for people; NULL for no such name. Replaces both names.
// FALSE: bad argument.
gboolean event_declaration_set_nice_names(EventDeclaration *declaration, const gchar *key,
                                          const gchar *key_nice_name, const gchar *value_nice_name);

// The namespace of a topic key, and a tag that says what a key is for. FALSE: bad argument.
gboolean event_declaration_set_namespace(EventDeclaration *declaration, const gchar *key,
                                         const gchar *name_space);
gboolean event_declaration_set_key_tag(EventDeclaration *declaration, const gchar *key,
                                       const gchar *tag);

// Makes the declaration a property with `key` as its state, in place of any other key. Current
// values are read through `callback`, when one is given, and otherwise are those last set or sent.
// FALSE: bad argument.
gboolean event_declaration_set_property(EventDeclaration *declaration, const gchar *key,
                                        EventPropertyCallback callback, gpointer user_data);

gboolean event_declaration_is_property(const EventDeclaration *declaration);

// --- Events ---

// The keys of the declaration that the event was prepared on, for setting values.
Inspectable *event_get_inspectable(Event *event);

// NULL is allowed.
void event_free(Event *event);

// --- Inspectables ---

// The setters return FALSE, and change nothing, when there is no such key, the key has another
// type, or the value does not fit it.
gboolean inspectable_set_int(Inspectable *inspectable, const gchar *key, gint32 value);
gboolean inspectable_set_bool(Inspectable *inspectable, const gchar *key, gboolean value);
gboolean inspectable_set_double(Inspectable *inspectable, const gchar *key, gdouble value);
gboolean inspectable_set_string(Inspectable *inspectable, const gchar *key, const gchar *value);

// Sets a key of type `type` (EVENT_KEY_...) from text. An int is decimal with nothing around it, a
// bool is "1", "0", "true" or "false", a double is a finite decimal number with a point whatever
// the locale, a string is taken as it stands.
gboolean inspectable_set_value_as_string(Inspectable *inspectable, const gchar *key, gint type,
                                         const gchar *value);

// As event_declaration_set_nice_names. FALSE for the inspectable of an event: names are declared.
gboolean inspectable_set_nice_names(Inspectable *inspectable, const gchar *key,
                                    const gchar *key_nice_name, const gchar *value_nice_name);

#ifdef __cplusplus
}
#endif
