// usermgmt/password.cpp: rules for clear text, salts and hashing.
#include "usermgmt/password.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <ctime>

#include <crypt.h>
#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include "usermgmt/precondition.h"
#include "usermgmt/secret.h"
#include "usermgmt/usermgmt.h"

static constexpr const char *RANDOM_DEVICE = "/dev/urandom";
static constexpr int RANDOM_LENGTH = 10;

// crypt(5): the base-64 alphabet of salts, by value.
static constexpr char salt_alphabet[] =
    "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
static_assert(sizeof salt_alphabet == 64 + 1);

const char *cipher_name(guint cipher) {
    static constexpr std::array names = {"DES",     "MD5",       "Invalid",   "Invalid",
                                         "Invalid", "SHA2/-256", "SHA2/-512", "Unknown"};
    return cipher < names.size() ? names[cipher] : "Invalid";
}

password_cipher cipher_from_hash(const char *hash) {
    struct prefix_row {
        const char *prefix;
        password_cipher cipher;
    };
    static constexpr prefix_row prefixes[] = {
        {"$1$", CIPHER_MD5    },
        {"$5$", CIPHER_SHA256 },
        {"$6$", CIPHER_SHA512 },
        {"$",   CIPHER_UNKNOWN},
    };

    if (hash == nullptr)
        return CIPHER_NO_HASH;
    for (const prefix_row &row : prefixes)
        if (g_str_has_prefix(hash, row.prefix))
            return row.cipher;
    return CIPHER_DES;
}

bool check_password_rules(const char *password, int max_length, GError **error) {
    if (password == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_PASSWORD, "missing password");
        return false;
    }
    if (*password == '\0') {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_PASSWORD,
                    "password too short, must have at least one character");
        return false;
    }
    if (max_length >= 1 && std::strlen(password) > static_cast<gsize>(max_length)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_PASSWORD,
                    "password too long, max allowed length is %d characters", max_length);
        return false;
    }
    return true;
}

// Fills the buffer from the kernel's generator. False with the reason logged.
static bool read_random(std::array<guchar, RANDOM_LENGTH> *random) {
    const int fd = open(RANDOM_DEVICE, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        syslog(LOG_ERR, "Failed to open /dev/urandom: %m");
        return false;
    }
    const ssize_t length = read(fd, random->data(), random->size());
    const int saved_errno = errno;
    (void)close(fd);  // it was only read from
    if (length == RANDOM_LENGTH)
        return true;
    syslog(LOG_ERR, "Failed to read from /dev/urandom: %s",
           length < 0 ? g_strerror(saved_errno) : "Short read");
    return false;
}

char *make_salt(int cipher) {
    // Never reset, so that two salts of one clock tick differ.
    static guint32 seed;
    seed += static_cast<guint32>(time(nullptr)) + static_cast<guint32>(getpid()) +
            static_cast<guint32>(clock());
    const char first = salt_alphabet[((seed >> 18) ^ (seed >> 6)) & 63];
    const char second = salt_alphabet[((seed >> 12) ^ seed) & 63];

    if (cipher == CIPHER_DES)
        return g_strdup_printf("%c%c", first, second);
    if (cipher != CIPHER_MD5 && cipher != CIPHER_SHA256 && cipher != CIPHER_SHA512) {
        syslog(LOG_ERR, "Unsupported cipher '%d'", cipher);
        return nullptr;
    }

    std::array<guchar, RANDOM_LENGTH> random = {};
    if (!read_random(&random)) {
        // Deliberate: -1, whatever was read.
        syslog(LOG_ERR, "Failed to generate salt. Expect %d bytes, got %d", RANDOM_LENGTH, -1);
        return nullptr;
    }
    char characters[RANDOM_LENGTH + 1] = {};
    for (std::size_t i = 0; i < random.size(); i++)
        characters[i] = salt_alphabet[random[i] & 63];
    return g_strdup_printf("$%d$%c%c%s$", cipher, first, second, characters);
}

// crypt(3) answers with a hash that begins with "*" where it cannot hash, and never with null in
// libxcrypt. Null with errno set on a failure; the caller owns the hash. The C library's own copy
// is wiped.
static char *hash_password(const char *clear_text, const char *setting) {
    errno = 0;
    char *result = crypt(clear_text, setting);
    if (result == nullptr)
        return nullptr;
    const int saved_errno = errno;
    char *hash = g_strdup(result);
    explicit_bzero(result, std::strlen(result));
    errno = saved_errno;
    return hash;
}

static bool is_failure_token(const char *hash) {
    return *hash == '*';
}

// Whether the clear text is the one behind the record's hash.
static bool is_same_password(const internal_user *intern, const char *clear_text, bool *out_same,
                             GError **error) {
    g_auto(secret_string) hash = hash_password(clear_text, intern->password);
    if (hash == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "could not perform crypt() check: %s", g_strerror(errno));
        return false;
    }
    // A setting that is no hash ("*", "!", empty) gives a failure token: a different password.
    *out_same = !is_failure_token(hash) && g_str_equal(hash, intern->password);
    return true;
}

// A fresh hash of the clear text; null on failure.
static char *make_hash(const char *clear_text, GError **error) {
    g_autofree char *salt = make_salt(CIPHER_SHA256);
    if (salt == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "could not create password salt");
        return nullptr;
    }
    g_auto(secret_string) hash = hash_password(clear_text, salt);
    if (hash == nullptr || is_failure_token(hash)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL, "crypt() failed, %m");
        return nullptr;
    }
    return g_steal_pointer(&hash);
}

// Stores a fresh hash unless the record holds one of the same password.
static bool replace_hash(internal_user *intern, const char *clear_text, bool *changed,
                         GError **error) {
    bool same = false;
    if (intern->password != nullptr && !is_same_password(intern, clear_text, &same, error))
        return false;
    if (same)
        return true;

    char *hash = make_hash(clear_text, error);
    if (hash == nullptr)
        return false;
    wipe_free(intern->password);
    intern->password = hash;
    intern->last_change = time(nullptr);
    *changed = true;
    return true;
}

bool internal_user_set_password(internal_user *intern, const char *clear_text, bool shadowed,
                                gboolean *changed, GError **error) {
    require(intern != NULL, false);

    bool record_changed = false;
    if (clear_text == nullptr) {
        record_changed = intern->password != nullptr;
        g_clear_pointer(&intern->password, wipe_free);
    } else if (*clear_text == '\0') {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_PASSWORD, "invalid password of size 0");
        return false;
    } else if (!replace_hash(intern, clear_text, &record_changed, error)) {
        return false;
    }

    if ((intern->shadowed != FALSE) != shadowed) {
        intern->shadowed = shadowed ? TRUE : FALSE;
        record_changed = true;
    }
    if (changed != nullptr && record_changed)
        *changed = TRUE;
    return true;
}
