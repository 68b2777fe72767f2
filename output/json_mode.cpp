// output/json_mode.cpp: the values of the option --json.
#include "output/json_mode.h"

#include <algorithm>
#include <cstring>
#include <iterator>

bool json_mode_find(const char *word, json_mode *out_mode) {
    static constexpr struct {
        const char *word;
        json_mode mode;
    } MODES[] = {
        {"short",  json_mode::SHORT },
        {"pretty", json_mode::PRETTY},
        {"off",    json_mode::OFF   },
    };

    const auto *found = std::find_if(std::begin(MODES), std::end(MODES), [word](const auto &row) {
        return std::strcmp(word, row.word) == 0;
    });
    if (found == std::end(MODES))
        return false;
    *out_mode = found->mode;
    return true;
}
