// tests/unit/platform/process_memory.h: looks for secrets in this process's memory.
#pragma once

#include <algorithm>
#include <cstddef>
#include <string>

// A secret is kept in this form, so that the looking finds no copy of its own.
constexpr char veil(char byte) {
    return static_cast<char>(byte ^ 0x55);
}

// A secret that stands in the program in that form only.
template <std::size_t size>
struct veiled_literal {
    char text[size];

    consteval explicit veiled_literal(const char (&literal)[size]) : text{} {
        std::transform(literal, literal + size, text, veil);
    }
    std::string string() const { return {text, size - 1}; }
};

// How often the secret, given veiled, stands in the writable memory of this process, freed memory
// included. The debugger that simulates a process keeps more copies, of its registers.
int count_copies(const std::string &veiled_secret);

// The secret itself, in memory of its own from which wipe removes it.
class unveiled {
  public:
    explicit unveiled(const std::string &veiled_secret);
    ~unveiled();
    unveiled(const unveiled &) = delete;
    unveiled &operator=(const unveiled &) = delete;

    const char *text() const { return text_; }
    void wipe();

  private:
    char *text_;
};
