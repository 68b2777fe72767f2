// usermgmt/secret.h: memory that is wiped before it is freed, internal to usermgmt.
#pragma once

#include <cstddef>
#include <cstdio>
#include <cstring>

#include <glib.h>

// Overwrites a string that is another's to free. Accepts null.
inline void wipe_text(char *secret) {
    if (secret != nullptr)
        explicit_bzero(secret, std::strlen(secret));
}

// Accepts null.
inline void wipe_free(char *secret) {
    wipe_text(secret);
    g_free(secret);
}

typedef char *secret_string;
G_DEFINE_AUTO_CLEANUP_FREE_FUNC(secret_string, wipe_free, nullptr)

// The buffer of a stream that carries secrets; the stream's own would be freed as it is. It must
// outlive the stream.
template <std::size_t size>
class wiped_stream_buffer_of {
  public:
    wiped_stream_buffer_of() = default;
    ~wiped_stream_buffer_of() { explicit_bzero(bytes_, sizeof bytes_); }
    wiped_stream_buffer_of(const wiped_stream_buffer_of &) = delete;
    wiped_stream_buffer_of &operator=(const wiped_stream_buffer_of &) = delete;

    // Right after the stream was opened.
    void give_to(FILE *stream) { (void)setvbuf(stream, bytes_, _IOFBF, sizeof bytes_); }

  private:
    char bytes_[size] = {};
};

// As large as the C library would make it.
using wiped_stream_buffer = wiped_stream_buffer_of<4096>;
// For a whole file, of any size.
using wiped_read_buffer = wiped_stream_buffer_of<std::size_t{32} * 1024>;
