// The table of backends.
#pragma once

// Makes every backend known to the port layer. Before the hardware description is loaded. Main
// thread.
void backends_register();
