// The manual triggers as ports: a virtual output for every video channel, whose event is declared
// while the channel, or the lack of camera control, says so. Where the channels come from is the
// affair of manual-triggers.h.
//
// Main thread.
#pragma once

enum class PtzState {
  kDisabled = 0,
  kEnabled = 1,
  kUnknown = 2,  // no coordinator, or one that does not say
};

// Wanted from now on. Channel n's port gets the number `first_virtual_port` + n - 1.
void manual_trigger_configure(int first_virtual_port);
bool manual_triggers_enabled();

// A channel, from 1 on, is there, and is enabled or disabled. Makes its port when it is new.
void manual_trigger_set_channel(int channel, bool enabled);
// Without camera control there is one view only, so only the first channel is sure of its trigger;
// the declarations of others that exist already stay.
void manual_trigger_set_ptz(PtzState state);
// Stores the state alone, for the channels that are about to be found.
void manual_trigger_store_ptz(PtzState state);
// The channel is gone: so is its port, and with it a sequence that runs on it.
void manual_trigger_remove_channel(int channel);

// Takes every enabled channel out of service and forgets them. At shutdown.
void manual_trigger_clear();
