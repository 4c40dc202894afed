// The hardware description of a supervised input on threshold events.
#pragma once

#include "port/ioport.h"

// A set_property. "mode" has to come before the ranges: it decides whose they are.
void iio_interrupt_set_property(IOPort *port, const char *section, const char *key,
                                const char *value);
