// check/findings.cpp: what the checker has found, in its order.
#include "check/findings.h"

#include <cstring>

#include "usermgmt/core_file.h"

static void finding_free(void *data) {
    auto *found = static_cast<finding *>(data);

    g_free(found->account);
    g_free(found->text);
    g_free(found);
}

findings::findings() : all_(g_ptr_array_new_with_free_func(finding_free)) {}

findings::~findings() {
    g_ptr_array_unref(all_);
}

void findings::add(gravity weight, const char *kind, const char *file, unsigned line,
                   const char *account, char *text) {
    auto *found = g_new(finding, 1);

    const bool has_account = account != nullptr && *account != '\0';
    *found = {weight, kind, file, line, has_account ? g_strdup(account) : nullptr, text};
    g_ptr_array_add(all_, found);
}

bool findings::has(gravity weight) const {
    guint count = 0;

    for (const finding *found : all())
        count += found->weight == weight ? 1 : 0;
    return count > 0;
}

void findings::keep(gravity weight) {
    for (guint i = all_->len; i > 0; i--)
        if (static_cast<const finding *>(all_->pdata[i - 1])->weight != weight)
            (void)g_ptr_array_remove_index(all_, i - 1);  // It is freed.
}

static int place_of(const finding *found) {
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (std::strcmp(core_file_table[row].path, found->file) == 0)
            return row;
    return CORE_FILE_COUNT;
}

static int compare(const void *one_slot, const void *other_slot) {
    const auto *one = *static_cast<const finding *const *>(one_slot);
    const auto *other = *static_cast<const finding *const *>(other_slot);
    const int places = place_of(one) - place_of(other);

    if (places != 0 || one->line == other->line)
        return places;
    return one->line < other->line ? -1 : 1;
}

// GLib's sort leaves equals in their order.
void findings::sort() {
    g_ptr_array_sort(all_, compare);
}

const char *gravity_name(gravity weight) {
    static constexpr const char *NAMES[] = {"notice", "change", "loss", "unusable"};
    return NAMES[static_cast<int>(weight)];
}
