// tests/fuzz/account_folder.h: the three account files of an input, and what must hold of the
// databases that are loaded from them.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "usermgmt/context.h"
#include "usermgmt/usermgmt.h"

struct account_texts {
    std::string passwd;
    std::string shadow;
    std::string group;
    bool has_shadow;
    guint32 open_flags;
};

// The parts of an input in this order: passwd, group, shadow, and a digit of open flags. What is
// missing is empty; without a third part there is no shadow file.
account_texts texts_of(const std::vector<std::string> &parts);

// Makes the files the process's account files, below its working folder.
void lay(const account_texts &texts);
// What they hold, with the members of a group sorted: a set has no order.
account_texts lying_texts();
// Whether a temporary file is left of a write.
bool is_any_temporary_left();

struct database_close {
    void operator()(usermgmt_ctx *ctx) const { (void)usermgmt_close(ctx); }
};
using open_database = std::unique_ptr<usermgmt_ctx, database_close>;

// The databases, a line for each record, the members of a group sorted.
std::string described(const usermgmt_ctx *ctx);

// A record begins with "+" or "-", which the C library writes without its IDs.
bool has_compat_names(const usermgmt_ctx *ctx);

// What holds of every database that was just loaded, by rules that are worked out here again: the
// indexes and the records agree, a type follows from the ID, every user's primary group exists, and
// the first line of the shadow file counts.
void check_loaded(const usermgmt_ctx *ctx, const account_texts &texts);
