// methods/accounts/notify.h: who learns of a change of the accounts.
//
// Nothing here can make a method fail: what goes wrong is only logged.
#pragma once

#include <glib.h>

#include "service/method.h"

// Stands for a change that concerns everybody, whatever the type of the account.
inline constexpr guint32 NOTIFY_EVERYBODY = 6;

// Sends the interface's signal to bus clients and SIGUSR1 to the parameter store's daemon, as the
// type of the changed user asks for.
void notify_user_db_updated(PrivaneSystem *skeleton, guint32 user_type);

// Sends SIGUSR1 to the parameter store's daemon.
void signal_cfgstore();

// Records in the parameter store that the root account was changed.
void set_root_password_flag();
