// tests/fuzz/hashes_fuzz.cpp: stored hashes of any form, against which a password is set and
// checked. The parts of the input: a byte of choices, the hash in the passwd file, the one in the
// shadow file, the password.
#include <crypt.h>
#include <pwd.h>
#include <shadow.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "methods/accounts/password_check.h"
#include "tests/fuzz/bus_call.h"
#include "tests/fuzz/fuzz.h"
#include "usermgmt/password.h"
#include "usermgmt/usermgmt.h"

static constexpr std::size_t MAX_CLEAR_TEXT = 511;
static constexpr std::size_t SALT_END = 15;
static constexpr std::string_view SALT_LETTERS =
    "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";

using optional_text = std::optional<std::string>;

// What the choices say.
struct stored_account {
    bool exists;
    bool has_line;  // in the shadow file
    bool was_shadowed;
    bool becomes_shadowed;
    bool is_clear_text_absent;
    optional_text hash;
    optional_text shadow_hash;
    std::string clear_text;
};

static const stored_account *account;
static std::string passwd_field;  // what the C library would hold in its own memory
static std::string shadow_field;
static std::string answer;
static char *last_answer;

// crypt(3) says so where it cannot hash; never what it was given.
static std::string failure_for(const std::string &setting) {
    return setting.starts_with("*0") ? "*1" : "*0";
}

char *real_crypt(const char *clear_text, const char *setting) asm("__real_crypt");

// The real hash where that takes microseconds, and one that costs nothing in place of the rest.
static std::string hash_of(const std::string &clear_text, const std::string &setting) {
    if (clear_text.size() > MAX_CLEAR_TEXT)
        return failure_for(setting);
    if (setting.size() >= 2 && has_only(setting.substr(0, 2), SALT_LETTERS))
        return real_crypt(clear_text.c_str(), setting.c_str());
    const std::size_t middle = setting.find('$', 1);
    const std::size_t end = middle != std::string::npos ? setting.find('$', middle + 1) : middle;
    if (!setting.starts_with('$') || end == std::string::npos)
        return failure_for(setting);
    return setting.substr(0, end + 1) +
           std::to_string(std::hash<std::string>()(setting.substr(0, end + 1) + clear_text));
}

// The linker sends the calls here (--wrap).

char *wrap_crypt(const char *clear_text, const char *setting) asm("__wrap_crypt");
char *wrap_crypt(const char *clear_text, const char *setting) {
    hold(clear_text == account->clear_text, "the password is hashed as it is", clear_text);
    answer = hash_of(clear_text, setting);
    last_answer = answer.data();
    if (answer.starts_with('*'))
        errno = EINVAL;
    return answer.data();
}

struct passwd *wrap_getpwnam(const char *name) asm("__wrap_getpwnam");
struct passwd *wrap_getpwnam(const char *) {
    static char name[] = "someone";
    static struct passwd line;
    passwd_field = account->hash.value_or("");
    line.pw_name = name;
    line.pw_passwd = account->hash ? passwd_field.data() : nullptr;
    return account->exists ? &line : nullptr;
}

struct spwd *wrap_getspnam(const char *name) asm("__wrap_getspnam");
struct spwd *wrap_getspnam(const char *) {
    static struct spwd line;
    shadow_field = account->shadow_hash.value_or("");
    line.sp_pwdp = account->shadow_hash ? shadow_field.data() : nullptr;
    return account->has_line ? &line : nullptr;
}

static void check_cipher(const optional_text &hash) {
    password_cipher expected = CIPHER_DES;
    if (!hash)
        expected = CIPHER_NO_HASH;
    else if (hash->starts_with("$1$"))
        expected = CIPHER_MD5;
    else if (hash->starts_with("$5$"))
        expected = CIPHER_SHA256;
    else if (hash->starts_with("$6$"))
        expected = CIPHER_SHA512;
    else if (hash->starts_with("$"))
        expected = CIPHER_UNKNOWN;
    hold(cipher_from_hash(hash ? hash->c_str() : nullptr) == expected,
         "a hash's prefix tells its cipher", hash.value_or("none"));
}

static void check_new_hash(const internal_user &user) {
    const std::string hash = user.password;
    hold(hash.starts_with("$5$") && hash.find('$', 3) == SALT_END &&
             has_only(hash.substr(3, SALT_END - 3), SALT_LETTERS),
         "a new hash has the form of ours", hash);
    hold(hash == hash_of(account->clear_text, hash), "a new hash is of the password", hash);
    hold(user.last_change > 0, "a new hash has its day");
}

static void check_set() {
    const stored_account &one = *account;
    internal_user user = {};
    gboolean changed = FALSE;
    g_autoptr(GError) error = nullptr;
    const bool is_empty = !one.is_clear_text_absent && one.clear_text.empty();
    const bool is_same =
        one.hash && !one.is_clear_text_absent && hash_of(one.clear_text, *one.hash) == *one.hash;
    const bool can_hash = one.clear_text.size() <= MAX_CLEAR_TEXT;
    const bool succeeds = one.is_clear_text_absent || (!is_empty && can_hash);

    user.shadowed = one.was_shadowed;
    user.password = one.hash ? g_strdup(one.hash->c_str()) : nullptr;
    last_answer = nullptr;
    const bool done = internal_user_set_password(
        &user, one.is_clear_text_absent ? nullptr : one.clear_text.c_str(), one.becomes_shadowed,
        &changed, &error);
    const optional_text now =
        user.password != nullptr ? optional_text(user.password) : optional_text();

    hold(done == succeeds && done == (error == nullptr),
         "a password is set unless it is no password", error != nullptr ? error->message : "");
    hold(last_answer == nullptr || *last_answer == '\0', "crypt's own copy is wiped");
    if (!done)
        hold(now == one.hash && !changed && (user.shadowed != FALSE) == one.was_shadowed,
             "a failure leaves the record as it was");
    else if (one.is_clear_text_absent)
        hold(!now, "no password leaves no hash");
    else if (is_same)
        hold(now == one.hash && user.last_change == 0, "the same password keeps its hash");
    else
        check_new_hash(user);
    hold(!done ||
             (changed != FALSE) == (now != one.hash || one.was_shadowed != one.becomes_shadowed),
         "a change is told");
    g_free(user.password);
}

static void check_login() {
    const stored_account &one = *account;
    const bool is_elsewhere =
        (one.hash == "x" || one.hash == "!") && one.has_line && one.shadow_hash;
    const optional_text &reference = is_elsewhere ? one.shadow_hash : one.hash;
    const int code = !one.exists  ? PRIVANE_ERROR_NO_USER
                     : !reference ? PRIVANE_ERROR_NO_HASH
                                  : PRIVANE_ERROR_WRONG_PASSWORD;
    const bool is_right =
        one.exists && reference && hash_of(one.clear_text, *reference) == *reference;

    bus_call bus;
    last_answer = nullptr;
    passwd_field.clear();
    shadow_field.clear();
    const bool done = bus.serve(handle_auth_user_basic, static_cast<const char *>("some\xff"),
                                one.clear_text.c_str());
    hold(done == is_right, "only the right password opens", reference.value_or("none"));
    hold(done || bus.code == code, "a refusal has its code", bus.text);
    hold(last_answer == nullptr || *last_answer == '\0', "crypt's own copy is wiped");
    const std::string &left = is_elsewhere ? shadow_field : passwd_field;
    hold(!one.exists || left.empty() || left[0] == '\0', "the hash that was looked up is wiped",
         left);
}

static std::string without_end(const std::string &part) {
    const std::string text = part.c_str();
    return text.ends_with('\n') ? text.substr(0, text.size() - 1) : text;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::vector<std::string> parts = parts_of(data, size);
    parts.resize(4);
    const unsigned choices = parts[0].empty() ? 0 : static_cast<unsigned char>(parts[0][0]);
    const auto chosen = [choices](unsigned bit) { return (choices >> bit & 1) != 0; };
    stored_account one = {!chosen(0), !chosen(1), chosen(2), chosen(3),
                          chosen(4),  {},         {},        without_end(parts[3])};
    if (!chosen(5))
        one.hash = without_end(parts[1]);
    if (!chosen(6))
        one.shadow_hash = without_end(parts[2]);

    account = &one;
    check_cipher(one.hash);
    check_set();
    check_login();
    return 0;
}
