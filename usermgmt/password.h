// usermgmt/password.h: rules for clear text, salts and hashing, internal to usermgmt.
#pragma once

#include <glib.h>

#include "usermgmt/account_records.h"

// The method numbers of crypt(5).
enum password_cipher {
    CIPHER_DES = 0,
    CIPHER_MD5 = 1,
    CIPHER_SHA256 = 5,
    CIPHER_SHA512 = 6,
    CIPHER_UNKNOWN = 7,
    CIPHER_NO_HASH = 8,
};

// The display name of a cipher; "Invalid" for any number that is none. Static strings.
const char *cipher_name(guint cipher);

// The cipher of a stored hash, by its prefix. A hash may be absent.
password_cipher cipher_from_hash(const char *hash);

// The limit is in bytes; 0 or less means none. USERMGMT_ERROR_PASSWORD.
bool check_password_rules(const char *password, int max_length, GError **error);

// A fresh salt in the format that crypt(3) takes as its setting, owned by the caller. Null, and the
// reason in syslog, for an unsupported cipher or without randomness.
char *make_salt(int cipher);

// Hashes the clear text into the record, or removes its password when there is none. The same
// password given again keeps the old hash. The flag, which may be null, is set when the record
// changed and otherwise left alone. USERMGMT_ERROR_PASSWORD or USERMGMT_ERROR_INTERNAL, the record
// unchanged; no error without a record.
bool internal_user_set_password(internal_user *intern, const char *clear_text, bool shadowed,
                                gboolean *changed, GError **error);
