// usermgmt/secret.h: memory that is wiped before it is freed, internal to usermgmt.
#pragma once

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
class wiped_stream_buffer {
  public:
    wiped_stream_buffer() = default;
    ~wiped_stream_buffer() { explicit_bzero(bytes_, sizeof bytes_); }
    wiped_stream_buffer(const wiped_stream_buffer &) = delete;
    wiped_stream_buffer &operator=(const wiped_stream_buffer &) = delete;

    // Right after the stream was opened.
    void give_to(FILE *stream) { (void)setvbuf(stream, bytes_, _IOFBF, sizeof bytes_); }

  private:
    char bytes_[4096] = {};
};
