// service/watchdog.h: signs of life for the service manager, as sd_notify(3) describes them.
#pragma once

// Gives them from the main loop, where the environment asks this process for any, and takes what it
// says about them out of the environment, so that no child gives them in the service's stead. Call
// it while there is one thread.
void watchdog_start();

// One more, if it is time for it. All calls that have come are served within one turn of the loop,
// and together may take longer than any single one.
void watchdog_feed();
