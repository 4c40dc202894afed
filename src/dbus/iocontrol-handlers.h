// The methods of the control interface.
#pragma once

#include "iocontrol-state-gen.h"

// Binds every method of the object to its handler. Handlers run on the main thread.
void iocontrol_connect_handlers(IOControlState *object);
