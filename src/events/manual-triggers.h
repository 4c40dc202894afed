// Follows the video streamer and the camera-control coordinator, so that every video channel has
// its manual trigger. Needs a first virtual input in the hardware description; see
// manual_trigger_configure().
//
// Each service is called on a thread of its own. A streamer that does not answer within 25 seconds
// has no channels until it restarts.
#pragma once

// Begins to follow what is there, what comes and what goes: the main loop makes the triggers. Does
// nothing unless manual triggers are configured. Main thread, once.
void manual_trigger_start();
// Stops following. The ports stay. Main thread.
void manual_trigger_stop();
