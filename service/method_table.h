// service/method_table.h: the methods that the service answers.
#pragma once

struct ServiceState;

// Connects each method of the table to the state's skeleton. Methods that are not in it are
// answered by GDBus as not implemented.
void connect_methods(ServiceState *state);
