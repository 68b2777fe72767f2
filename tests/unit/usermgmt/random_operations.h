// tests/unit/usermgmt/random_operations.h: account files and changes by chance, the same for the
// same seed.
#pragma once

#include <functional>
#include <optional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include <glib.h>

#include "tests/unit/usermgmt/account_lines.h"

enum class operation_kind {
    add_user,
    modify_user,
    delete_user,
    disable_password,
    add_group,
    delete_group,
    reopen,
};
constexpr int OPERATION_KINDS = 7;

// A file call that fails, and how many of the files, in their order, are replaced all the same.
struct planned_fault {
    std::string call;
    std::string path;
    int nth;
    int replaced;
};

using optional_text = std::optional<std::string>;
using optional_texts = std::optional<std::vector<std::string>>;

// What is absent here is given as null.
struct operation {
    operation_kind kind;
    optional_text account = std::nullopt;  // the user or group that the operation is about
    guint32 type = 0;
    optional_text name = std::nullopt;
    optional_text password = std::nullopt;
    optional_text group = std::nullopt;
    optional_texts names = std::nullopt;  // secondary groups, or the members of a new group
    optional_text gecos = std::nullopt;
    optional_text shell = std::nullopt;
    gint32 uid = -1;
    gint64 seconds_later = 0;  // since the operation before
    std::optional<planned_fault> fault = std::nullopt;
};

std::string described(const operation &what);

struct starting_files {
    std::string texts[CORE_FILE_COUNT];
    unsigned modes[CORE_FILE_COUNT];
    bool has_shadow;
    guint32 open_flags;
};

class random_operations {
  public:
    explicit random_operations(guint64 seed) : source_(std::mt19937_64(seed)) {}
    // Every choice is one number of the source.
    explicit random_operations(std::function<guint64()> source) : source_(std::move(source)) {}

    starting_files next_files();
    operation next_operation(bool with_fault);
    // True once in so many times.
    bool once_in(unsigned times) { return source_() % times == 0; }
    unsigned below(unsigned limit) { return static_cast<unsigned>(source_() % limit); }

  private:
    std::string line_pool(const std::vector<const char *> &pool);
    std::string user_name();
    std::string group_name();
    std::vector<std::string> group_names();
    optional_text comment();
    optional_text shell();
    optional_text password();
    void fill_new_user(operation *what);
    void fill_modification(operation *what);
    planned_fault fault(bool of_groups);

    std::function<guint64()> source_;
};
