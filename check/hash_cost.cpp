// check/hash_cost.cpp: reads the cost from a password's hash.
#include "check/hash_cost.h"

#include <charconv>

static constexpr guint64 MOST_SHA_ROUNDS = 1'000'000;
static constexpr guint64 MOST_BLOWFISH_ROUNDS = guint64{1} << 14;
static constexpr std::string_view ROUNDS = "rounds=";

static guint64 number_at(std::string_view text) {
    guint64 number = 0;
    (void)std::from_chars(text.data(), text.data() + text.size(), number);
    return number;
}

static bool is_blowfish(std::string_view hash) {
    return hash.size() > 6 && hash.starts_with("$2") && hash[3] == '$';
}

guint64 hash_rounds(std::string_view hash) {
    if (hash.starts_with("$5$") || hash.starts_with("$6$")) {
        const std::string_view rest = hash.substr(3);
        return rest.starts_with(ROUNDS) ? number_at(rest.substr(ROUNDS.size())) : 0;
    }
    if (is_blowfish(hash)) {
        const guint64 power = number_at(hash.substr(4, 2));
        return power < 64 ? guint64{1} << power : 0;
    }
    return 0;
}

bool is_absurd_hash(std::string_view hash) {
    return hash_rounds(hash) > (is_blowfish(hash) ? MOST_BLOWFISH_ROUNDS : MOST_SHA_ROUNDS);
}
