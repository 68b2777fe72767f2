// methods/accounts/password_check.cpp: the method that checks a password.
//
// The accounts are looked up through the C library, so that the files count as they stand on disk.
#include "methods/accounts/password_check.h"

#include <cstring>

#include <crypt.h>
#include <pwd.h>
#include <shadow.h>

#include "service/method.h"

// The hash to compare with, in the C library's static storage; null when there is none.
static char *reference_hash(const struct passwd *user) {
    char *hash = user->pw_passwd;
    if (g_strcmp0(hash, "x") != 0 && g_strcmp0(hash, "!") != 0)
        return hash;
    const struct spwd *shadow = getspnam(user->pw_name);
    return shadow != nullptr && shadow->sp_pwdp != nullptr ? shadow->sp_pwdp : hash;
}

static bool is_password_of(const char *password, const char *hash) {
    char *result = crypt(password, hash);
    if (result == nullptr)
        return false;
    const bool same = g_str_equal(result, hash);
    explicit_bzero(result, std::strlen(result));
    return same;
}

// Holds the lock, since getpwnam, getspnam and crypt answer in static storage.
static bool check_password(method_call &call, const char *name, const char *password) {
    [[maybe_unused]] g_autoptr(GMutexLocker) locker = g_mutex_locker_new(&call.state->auth_lock);

    const struct passwd *user = getpwnam(name);
    if (user == nullptr) {
        // Deliberate: logged twice, here and by fail.
        g_warning("Failed to locate user %s.", name);
        return fail(call, PRIVANE_ERROR_NO_USER, "Failed to locate user %s.", name);
    }
    char *hash = reference_hash(user);
    if (hash == nullptr)
        return fail(call, PRIVANE_ERROR_NO_HASH, "No valid hash for user %s", name);
    const bool is_right = is_password_of(password, hash);
    explicit_bzero(hash, std::strlen(hash));
    if (!is_right)
        return fail(call, PRIVANE_ERROR_WRONG_PASSWORD, "No valid password for user %s", name);
    return true;
}

bool handle_auth_user_basic(method_call &call, const char *user, const char *password) {
    if (!check_password(call, user, password))
        return false;

    privane_system__complete_auth_user_basic(call.skeleton, call.invocation);
    return true;
}
