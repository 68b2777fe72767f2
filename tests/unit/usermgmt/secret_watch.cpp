// tests/unit/usermgmt/secret_watch.cpp: proof that secrets are wiped before they are freed.
#include "tests/unit/usermgmt/secret_watch.h"

#include <cstring>
#include <functional>

#include <malloc.h>

#include <glib.h>

// The linker sends the g_free of all code outside of GLib's own library here (--wrap).
void real_g_free(void *memory) asm("__real_g_free");
void wrap_g_free(void *memory) asm("__wrap_g_free");

static secret_watch *active;

void wrap_g_free(void *memory) {
    if (active != nullptr)
        active->on_free(memory);
    real_g_free(memory);
}

secret_watch::secret_watch() {
    active = this;
}

secret_watch::~secret_watch() {
    active = nullptr;
}

void secret_watch::add(const char *secret) {
    watched_.push_back({secret, std::strlen(secret)});
}

void secret_watch::on_free(const void *memory) {
    // A secret may stand anywhere in the block.
    const auto *block = static_cast<const char *>(memory);
    const char *end = block + malloc_usable_size(const_cast<void *>(memory));
    for (const watched &secret : watched_) {
        if (std::less<>()(secret.memory, block) || !std::less<>()(secret.memory, end))
            continue;
        const std::string held(secret.memory, secret.size);
        if (held == std::string(secret.size, '\0'))
            wiped_++;
        else
            readable_.push_back(held);
    }
}
