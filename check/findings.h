// check/findings.h: what the checker has found.
#pragma once

#include <glib.h>

#include "usermgmt/account_records.h"

// In the order of their gravity.
enum class gravity {
    NOTICE,    // worth knowing; a write keeps it
    CHANGE,    // a write makes it otherwise, or drops what is no account
    LOSS,      // a write drops an account or a group, or may
    UNUSABLE,  // the service could not start, or not write
};

struct finding {
    gravity weight;
    const char *kind;  // a word of the manual's, which scripts may rely on
    const char *file;  // of core_file_table, or the gshadow file
    unsigned line;     // from 1; 0: of the whole file
    char *account;     // a user or a group, or null
    char *text;        // a sentence for people; holds no password and no hash
};

class findings {
  public:
    findings();
    ~findings();
    findings(const findings &) = delete;
    findings &operator=(const findings &) = delete;

    // Takes the text.
    void add(gravity weight, const char *kind, const char *file, unsigned line, const char *account,
             char *text);

    records<const finding> all() const { return records<const finding>(all_); }
    bool has(gravity weight) const;
    // Forgets all others.
    void keep(gravity weight);
    // By file, in the order of core_file_table, then by line; else as they were found.
    void sort();

  private:
    GPtrArray *all_;
};

// "notice", "change", "loss", "unusable".
const char *gravity_name(gravity weight);
