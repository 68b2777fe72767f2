// tests/unit/platform/process_memory.cpp: looks for secrets in this process's memory.
#include "tests/unit/platform/process_memory.h"

#include <algorithm>
#include <cinttypes>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

static constexpr std::size_t BLOCK_SIZE = 64 * 1024;

// Larger ones are the shadow memory of a sanitizer, which holds no data of the program.
static constexpr std::uint64_t LARGEST_MAPPING = 1ULL << 36;

static char *new_block() {
    void *block =
        mmap(nullptr, BLOCK_SIZE, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (block == MAP_FAILED)
        std::abort();
    return static_cast<char *>(block);
}

unveiled::unveiled(const std::string &veiled_secret) : text_(new_block()) {
    std::transform(veiled_secret.begin(), veiled_secret.end(), text_, veil);
}

unveiled::~unveiled() {
    (void)munmap(text_, BLOCK_SIZE);
}

void unveiled::wipe() {
    explicit_bzero(text_, BLOCK_SIZE);
}

static bool is_copy(const char *memory, const std::string &veiled_secret) {
    for (std::size_t i = 1; i < veiled_secret.size(); i++) {
        if (veil(memory[i]) != veiled_secret[i])
            return false;
    }
    return true;
}

// Of those that begin in the first bytes of the block.
static int count_in_block(const char *block, std::size_t starts, const std::string &veiled_secret) {
    const char first = veil(veiled_secret[0]);
    int copies = 0;

    for (const char *at = block; at < block + starts; at++) {
        at = static_cast<const char *>(
            std::memchr(at, first, static_cast<std::size_t>(block + starts - at)));
        if (at == nullptr)
            break;
        copies += is_copy(at, veiled_secret) ? 1 : 0;
    }
    return copies;
}

// What was never touched holds nothing, and a sanitizer reserves much of that.
static bool is_any_page_there(int page_map, std::uint64_t begin, std::uint64_t end) {
    static constexpr std::uint64_t PRESENT_OR_SWAPPED = 3ULL << 62;
    const auto page_size = static_cast<std::uint64_t>(sysconf(_SC_PAGESIZE));

    for (std::uint64_t page = begin / page_size; page * page_size < end; page++) {
        std::uint64_t entry = 0;
        if (pread(page_map, &entry, sizeof entry, static_cast<off_t>(page * sizeof entry)) !=
                sizeof entry ||
            (entry & PRESENT_OR_SWAPPED) != 0)
            return true;
    }
    return false;
}

struct memory_files {
    int memory;
    int page_map;
};

// Blocks overlap by less than a secret, so that each copy is seen once.
static int count_in(const memory_files &files, std::uint64_t begin, std::uint64_t end, char *block,
                    const std::string &veiled_secret) {
    int copies = 0;

    while (begin + veiled_secret.size() <= end) {
        const std::size_t wanted = std::min<std::uint64_t>(BLOCK_SIZE, end - begin);
        const std::size_t starts = wanted - veiled_secret.size() + 1;
        if (is_any_page_there(files.page_map, begin, begin + wanted)) {
            if (pread(files.memory, block, wanted, static_cast<off_t>(begin)) !=
                static_cast<ssize_t>(wanted))
                std::abort();
            copies += count_in_block(block, starts, veiled_secret);
        }
        begin += starts;
    }
    explicit_bzero(block, BLOCK_SIZE);
    return copies;
}

// The list of mappings. Without an allocation, which would take the place of what was freed last.
static const char *read_maps() {
    static char text[512 * 1024];
    const int fd = open("/proc/self/maps", O_RDONLY | O_CLOEXEC);
    std::size_t length = 0;
    ssize_t count = 0;

    while (length < sizeof text - 1 &&
           (count = read(fd, text + length, sizeof text - 1 - length)) > 0)
        length += static_cast<std::size_t>(count);
    if (count != 0)
        std::abort();
    (void)close(fd);
    text[length] = '\0';
    return text;
}

int count_copies(const std::string &veiled_secret) {
    const char *line = read_maps();
    const memory_files files = {open("/proc/self/mem", O_RDONLY | O_CLOEXEC),
                                open("/proc/self/pagemap", O_RDONLY | O_CLOEXEC)};
    char *block = new_block();
    int copies = 0;

    if (files.memory < 0 || files.page_map < 0)
        std::abort();
    for (; *line != '\0'; line = std::strchr(line, '\n') + 1) {
        std::uint64_t begin = 0;
        std::uint64_t end = 0;
        char rights[5] = "";
        if (std::sscanf(line, "%" SCNx64 "-%" SCNx64 " %4s", &begin, &end, rights) != 3 ||
            std::strncmp(rights, "rw", 2) != 0 || end - begin > LARGEST_MAPPING)
            continue;
        // The block that is read into may be a part of a larger mapping.
        const std::uint64_t own = reinterpret_cast<std::uintptr_t>(block);
        if (own >= begin && own < end) {
            copies += count_in(files, begin, own, block, veiled_secret);
            copies += count_in(files, own + BLOCK_SIZE, end, block, veiled_secret);
        } else {
            copies += count_in(files, begin, end, block, veiled_secret);
        }
    }
    (void)close(files.memory);
    (void)close(files.page_map);
    (void)munmap(block, BLOCK_SIZE);
    return copies;
}
