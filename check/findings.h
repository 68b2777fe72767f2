// check/findings.h: what the checker has found.
#pragma once

#include <span>
#include <string>
#include <vector>

// In the order of their gravity.
enum class gravity {
    NOTICE,    // worth knowing; a write keeps it
    CHANGE,    // a write makes it otherwise, or drops what is no account
    LOSS,      // a write drops an account or a group
    UNUSABLE,  // the service could not start, or not write
};

struct finding {
    gravity weight;
    const char *kind;  // a word of its own for each kind, which scripts may rely on
    std::string file;
    unsigned line;        // from 1; 0: of the whole file
    std::string account;  // a user or a group; may be empty
    std::string text;     // a sentence for people; holds no password and no hash
};

class findings {
  public:
    void add(finding found) { all_.push_back(std::move(found)); }

    std::span<const finding> all() const { return all_; }
    bool has(gravity weight) const;
    // Forgets all that weigh less.
    void keep(gravity least);
    // By file, in the given order, then by line.
    void sort(std::span<const std::string> files);

  private:
    std::vector<finding> all_;
};

// "notice", "change", "loss", "unusable".
const char *gravity_name(gravity weight);
