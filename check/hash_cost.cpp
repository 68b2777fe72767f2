// check/hash_cost.cpp: reads the cost from a password's hash, in the forms of crypt(5).
#include "check/hash_cost.h"

#include <charconv>
#include <limits>

// Each takes between a sixth of a second and a whole one on a desktop, and some on a camera.
static constexpr guint64 MOST_SHA_ROUNDS = 1'000'000;
static constexpr guint64 MOST_BLOWFISH_ROUNDS = guint64{1} << 14;
static constexpr guint64 MOST_SUN_ROUNDS = 250'000;
static constexpr guint64 MOST_DES_ROUNDS = guint64{1} << 21;
// And more than a camera has to spare.
static constexpr guint64 MOST_MEMORY = guint64{128} << 20;

static constexpr guint64 MEBIBYTE = guint64{1} << 20;
static constexpr guint64 TOO_MUCH = std::numeric_limits<guint64>::max();

// crypt(3)'s own order of characters; unlike that of base64.
static constexpr std::string_view DIGITS =
    "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";

// A decimal number in front of something else. One that is too large for us is told as it is.
static guint64 number_at(std::string_view text) {
    guint64 number = 0;
    const auto [end, fault] = std::from_chars(text.data(), text.data() + text.size(), number);

    return fault == std::errc::result_out_of_range ? TOO_MUCH : number;
}

static guint64 times(guint64 one, guint64 other) {
    guint64 product = 0;
    return __builtin_mul_overflow(one, other, &product) ? TOO_MUCH : product;
}

static guint64 power_of_two(guint64 exponent) {
    return exponent < 64 ? guint64{1} << exponent : TOO_MUCH;
}

// Takes digits off the text. False where there are not so many.
class digit_reader {
  public:
    explicit digit_reader(std::string_view text) : rest_(text) {}

    bool is_at(char byte) const { return !rest_.empty() && rest_.front() == byte; }

    bool digit(guint64 *out_value) {
        const std::size_t value =
            rest_.empty() ? std::string_view::npos : DIGITS.find(rest_.front());
        if (value == std::string_view::npos)
            return false;
        rest_.remove_prefix(1);
        *out_value = value;
        return true;
    }

    // The least significant first.
    bool fixed(int digits, guint64 *out_value) {
        guint64 number = 0;
        guint64 value = 0;
        for (int i = 0; i < digits; i++) {
            if (!digit(&value))
                return false;
            number |= value << (6 * i);
        }
        *out_value = number;
        return true;
    }

    // yescrypt's: the first digit tells how many follow, and small numbers take one.
    bool variable(guint64 lowest, guint64 *out_value) {
        guint64 number = lowest;
        guint64 first = 0;
        guint64 last = 47;
        guint64 value = 0;
        int more = 0;
        if (!digit(&value))
            return false;
        while (value > last) {
            number += (last + 1 - first) << (6 * more);
            first = last + 1;
            last = first + (62 - last) / 2;
            more++;
        }
        number += (value - first) << (6 * more);
        while (more-- > 0) {
            if (!digit(&value))
                return false;
            number += value << (6 * more);
        }
        *out_value = number;
        return true;
    }

  private:
    std::string_view rest_;
};

static guint64 sha_rounds(std::string_view options) {
    static constexpr std::string_view ROUNDS = "rounds=";
    return options.starts_with(ROUNDS) ? number_at(options.substr(ROUNDS.size())) : 0;
}

static guint64 blowfish_rounds(std::string_view options) {
    return options.size() > 2 ? power_of_two(number_at(options.substr(0, 2))) : 0;
}

static guint64 des_rounds(std::string_view options) {
    guint64 rounds = 0;
    return digit_reader(options).fixed(4, &rounds) ? rounds : 0;
}

static guint64 memory_of(guint64 exponent, guint64 block, guint64 passes) {
    return times(times(times(power_of_two(exponent), block), 128), passes);
}

static guint64 scrypt_memory(std::string_view options) {
    digit_reader reader(options);
    guint64 exponent = 0;
    guint64 block = 0;
    guint64 lanes = 0;

    return reader.digit(&exponent) && reader.fixed(5, &block) && reader.fixed(5, &lanes)
               ? memory_of(exponent, block, lanes)
               : 0;
}

// A flavour, the exponent and the block; where more follows, a mask of what, of which lanes and
// further passes make it slower.
static guint64 yescrypt_memory(std::string_view options) {
    static constexpr guint64 HAS_LANES = 1, HAS_PASSES = 2;
    digit_reader reader(options);
    guint64 flavour = 0;
    guint64 exponent = 0;
    guint64 block = 0;
    guint64 mask = 0;
    guint64 lanes = 1;
    guint64 passes = 1;

    if (!reader.variable(0, &flavour) || !reader.variable(1, &exponent) ||
        !reader.variable(1, &block))
        return 0;
    if (!reader.is_at('$') &&
        (!reader.variable(1, &mask) || ((mask & HAS_LANES) != 0 && !reader.variable(2, &lanes)) ||
         ((mask & HAS_PASSES) != 0 && !reader.variable(1, &passes))))
        return 0;
    return memory_of(exponent, block, times(lanes, passes));
}

struct hash_method {
    std::string_view prefix;
    hash_work work;
    guint64 (*amount)(std::string_view options);  // of what follows the prefix
    guint64 most;
};

// The first that fits counts.
static constexpr hash_method METHODS[] = {
    {"$y$",          hash_work::MEMORY,  yescrypt_memory, MOST_MEMORY         },
    {"$gy$",         hash_work::MEMORY,  yescrypt_memory, MOST_MEMORY         },
    {"$7$",          hash_work::MEMORY,  scrypt_memory,   MOST_MEMORY         },
    {"$2a$",         hash_work::ROUNDS,  blowfish_rounds, MOST_BLOWFISH_ROUNDS},
    {"$2b$",         hash_work::ROUNDS,  blowfish_rounds, MOST_BLOWFISH_ROUNDS},
    {"$2x$",         hash_work::ROUNDS,  blowfish_rounds, MOST_BLOWFISH_ROUNDS},
    {"$2y$",         hash_work::ROUNDS,  blowfish_rounds, MOST_BLOWFISH_ROUNDS},
    {"$6$",          hash_work::ROUNDS,  sha_rounds,      MOST_SHA_ROUNDS     },
    {"$5$",          hash_work::ROUNDS,  sha_rounds,      MOST_SHA_ROUNDS     },
    {"$sha1$",       hash_work::ROUNDS,  number_at,       MOST_SHA_ROUNDS     },
    {"$md5,rounds=", hash_work::ROUNDS,  number_at,       MOST_SUN_ROUNDS     },
    {"_",            hash_work::ROUNDS,  des_rounds,      MOST_DES_ROUNDS     },
    {"$md5$",        hash_work::NOTHING, nullptr,         0                   },
    {"$1$",          hash_work::NOTHING, nullptr,         0                   },
    {"$3$",          hash_work::NOTHING, nullptr,         0                   },
    {"$",            hash_work::UNKNOWN, nullptr,         0                   },
};

// What has no prefix is a hash of DES, or none, as "*" and "!" are.
hash_cost find_hash_cost(std::string_view hash) {
    for (const hash_method &method : METHODS) {
        if (!hash.starts_with(method.prefix))
            continue;
        if (method.amount == nullptr)
            return {method.work, 0, false};
        const guint64 amount = method.amount(hash.substr(method.prefix.size()));
        return {method.work, amount, amount > method.most};
    }
    return {hash_work::NOTHING, 0, false};
}

// "$name$" of a hash, or nothing where it does not look like one: it may be a password that
// somebody wrote there.
static std::string_view method_name(std::string_view hash) {
    static constexpr std::size_t LONGEST = 16;
    const std::size_t end = hash.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789-", 1);

    if (end == std::string_view::npos || end == 1 || end > LONGEST || hash[end] != '$')
        return {};
    return hash.substr(0, end + 1);
}

char *describe_hash(std::string_view hash) {
    const hash_cost cost = find_hash_cost(hash);

    if (cost.work == hash_work::UNKNOWN) {
        const std::string_view name = method_name(hash);
        g_autofree char *quoted =
            name.empty() ? g_strdup("")
                         : g_strdup_printf(", %.*s,", static_cast<int>(name.size()), name.data());
        return g_strdup_printf(
            "the method of its hash%s is none of crypt(5): whether anybody can "
            "log in by it is not known, nor what a check costs",
            quoted);
    }
    if (!cost.is_absurd)
        return nullptr;
    if (cost.work == hash_work::MEMORY)
        return g_strdup_printf("each check of the password works through %" G_GUINT64_FORMAT
                               " MiB of memory, in which the service serves nobody else",
                               cost.amount / MEBIBYTE);
    return g_strdup_printf("each check of the password takes %" G_GUINT64_FORMAT
                           " rounds, in which the service serves nobody else",
                           cost.amount);
}
