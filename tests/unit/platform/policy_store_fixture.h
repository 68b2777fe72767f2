// tests/unit/platform/policy_store_fixture.h: a policy store on files in a temporary folder.
#pragma once

#include <cstdio>
#include <string>
#include <vector>

#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/authz/policy/policy_store.h"
#include "tests/unit/platform/coarse_times.h"
#include "tests/unit/platform/line_calls.h"
#include "tests/unit/platform/scratch_folder.h"

inline const std::string PASSWD = "root:x:0:0:root:/root:/bin/sh\nclerk:x:701:701::/:/bin/sh\n";
inline const std::string GROUP = "root:x:0:\nviewers:x:750:clerk\n";

class PolicyStore : public testing::Test {
  protected:
    void SetUp() override {
        folder_.write("passwd", PASSWD);
        folder_.write("group", GROUP);
        grant("users=clerk", "x.y");
        open(geteuid());
    }

    void TearDown() override {
        reset_times();
        watch_line_calls();
        policy_store_free(store_);
    }

    void open(uid_t owner) {
        policy_store_free(store_);
        store_ = policy_store_new({policy_.c_str(), passwd_.c_str(), group_.c_str(), owner});
    }

    void grant(const std::string &whom, const std::string &what) {
        folder_.write("policy", "[role a]\n" + whom + "\nactions=" + what + "\n");
    }

    // "yes" or "no", or the error; the folder's name is left out.
    std::string ask(guint32 uid, const std::vector<guint32> &gids = {}) {
        g_autoptr(GError) error = nullptr;
        if (policy_store_refresh(store_, &error))
            return policy_store_allows(store_, {uid, gids.data(), gids.size()}, "x.y") ? "yes"
                                                                                       : "no";
        std::string text = error->message;
        const std::size_t place = text.find(folder_.path() + "/");
        if (place != std::string::npos)
            text.replace(place, folder_.path().size() + 1, "");
        return std::string(g_quark_to_string(error->domain)) + " " + std::to_string(error->code) +
               " " + text;
    }

    // Written beside it and renamed, as installers do.
    void replace(const std::string &name, const std::string &text) {
        folder_.write("new", text);
        ASSERT_EQ(rename(folder_.path("new").c_str(), folder_.path(name).c_str()), 0);
    }

    scratch_folder folder_;
    const std::string policy_ = folder_.path("policy");
    const std::string passwd_ = folder_.path("passwd");
    const std::string group_ = folder_.path("group");
    policy_store *store_ = nullptr;
};
