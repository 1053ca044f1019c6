// Bringing the service up: support library, host-call connection, worker.
#pragma once

namespace bridge {

// Runs native_init's steps. Steps that succeeded once are not repeated: a
// second call after a good start starts nothing (a second connection would
// leak the first under the worker, a second worker would break in-order
// delivery), and a call after a failed start retries only what failed. The
// debug switch is read on every successful call.
void startService();

}  // namespace bridge
