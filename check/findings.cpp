// check/findings.cpp: what the checker has found, in its order.
#include "check/findings.h"

#include <algorithm>

bool findings::has(gravity weight) const {
    return std::any_of(all_.begin(), all_.end(),
                       [weight](const finding &found) { return found.weight == weight; });
}

void findings::keep(gravity least) {
    std::erase_if(all_, [least](const finding &found) { return found.weight < least; });
}

void findings::sort(std::span<const std::string> files) {
    const auto place_of = [&files](const finding &found) {
        return std::find(files.begin(), files.end(), found.file);
    };
    std::stable_sort(all_.begin(), all_.end(), [&](const finding &one, const finding &other) {
        if (place_of(one) != place_of(other))
            return place_of(one) < place_of(other);
        return one.line < other.line;
    });
}

const char *gravity_name(gravity weight) {
    static constexpr const char *names[] = {"notice", "change", "loss", "unusable"};
    return names[static_cast<int>(weight)];
}
