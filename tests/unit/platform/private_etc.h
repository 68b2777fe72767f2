// tests/unit/platform/private_etc.h: a /etc of its own for a process.
#pragma once

// Lays an empty folder over /etc, for this process alone. Where this fails, which it says, the
// process must do nothing that works on /etc.
bool enter_private_etc();
