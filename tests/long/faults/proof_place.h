// tests/long/faults/proof_place.h: where the proofs work: a /etc and a folder of their own.
#pragma once

#include <string>

// Takes the process into a mount namespace of its own, with an empty /etc and empty locks, and into
// a folder with an empty folder "etc", and installs the call trap. For the whole of the process.
class proof_place {
  public:
    proof_place();
    ~proof_place();
    proof_place(const proof_place &) = delete;
    proof_place &operator=(const proof_place &) = delete;

    // False, and the reason told, where that failed.
    bool is_ready() const { return ready_; }
    const std::string &folder() const { return folder_; }

  private:
    bool prepare();

    bool ready_ = false;
    std::string folder_;
};

// Whether the file beside the folder "etc" is as it was, and nothing appeared beside it.
bool outside_is_untouched();
