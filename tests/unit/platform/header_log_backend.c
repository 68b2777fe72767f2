/* tests/unit/platform/header_log_backend.c: log_backend.h is C, with the agreed functions. */
#include "platform/log_backend/log_backend.h"

#include "platform/log_backend/log_backend.h"

int main(void) {
    void (*to_stdout)(void) = log_backend_stdout;
    void (*to_syslog)(void) = log_backend_syslog;

    return to_stdout != 0 && to_syslog != 0 ? 0 : 1;
}
