// Telling the rest of the device that ports have come or gone.
#pragma once

// Renews what older configuration tools see, where they are served, and arms the watches and
// declares the events of every port in service anew. Main thread.
void reannounce_ports();
