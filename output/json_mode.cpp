// output/json_mode.cpp: the values of the option --json.
#include "output/json_mode.h"

#include <cstring>

bool json_mode_find(const char *word, json_mode *out_mode) {
    static constexpr struct {
        const char *word;
        json_mode mode;
    } MODES[] = {
        {"short",  json_mode::SHORT },
        {"pretty", json_mode::PRETTY},
        {"off",    json_mode::OFF   },
    };

    for (const auto &row : MODES)
        if (std::strcmp(word, row.word) == 0) {
            *out_mode = row.mode;
            return true;
        }
    return false;
}
