// The D-Bus names of the error codes.
#pragma once

// Makes the names known, so that errors of the port layer travel under them. Repeating does no
// harm. Any thread.
void io_error_domains_register();
