// tests/unit/usermgmt/outgoing_files.h: databases on their way to the account files.
#pragma once

#include "tests/unit/usermgmt/account_files.h"

// Two users and two groups that are about to replace files that hold something else.
class OutgoingFiles : public AccountFiles {
  protected:
    static constexpr const char *OLD_TEXT[CORE_FILE_COUNT] = {"old passwd\n", "old shadow\n",
                                                              "old group\n"};
    static constexpr const char *NEW_TEXT[CORE_FILE_COUNT] = {
        "root:x:0:0::/root:/bin/sh\nalice:x:1000:100:Alice:/home/alice:/bin/false\n",
        "root:rootshash:1:0:99999:7:0::\nalice:aliceshash:2:0:99999:7:0::\n",
        "root::0:\nusers::100:alice\n",
    };

    void SetUp() override;
    void TearDown() override;

    // Writes what is dirty of data_ through the table's rows.
    bool sync(bool stop_on_error = true);

    // One word for each file: "old", "new" or "other".
    static lines states();
    // One digit for each file: whether it still counts as to be written.
    std::string dirty() const;

    core_file_data data_[CORE_FILE_COUNT] = {};
    error_slot error_;

  private:
    GPtrArray *users_ = nullptr;
    GPtrArray *groups_ = nullptr;
};
