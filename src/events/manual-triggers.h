// Follows the video streamer and the camera-control coordinator, so that every video channel has
// its manual trigger. Needs a first virtual input in the hardware description; see
// manual_trigger_configure().
//
// Calls of the two services block. One that hangs holds the start back for 25 seconds each, 50 for
// both; a streamer that hangs when it comes back to the bus holds the daemon for 25 seconds once.
// A streamer that answers late is waited for, for at most 85 seconds over all of its channels.
#pragma once

// Makes the triggers of the channels that exist now and follows what comes and goes. Does nothing
// unless manual triggers are configured. Main thread, once.
void manual_trigger_start();
// Stops following. The ports stay. Main thread.
void manual_trigger_stop();
