// The plain backends by kind, and the words that the hardware description has for them.
#pragma once

// Makes every plain backend known to the port layer. Once, before the hardware description is
// loaded.
void backends_register();
