// tests/unit/usermgmt/golden_test.cpp: operations on whole sets of account files, one folder each.
//
// A case is a folder of tests/golden: the files in before/, the name of the operation and its
// arguments in call, a line each, and what has to come of it: the files in after/, without which
// none may change, the error in error, and the lines for syslog in log.
#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

namespace fs = std::filesystem;

using operation = gboolean (*)(usermgmt_ctx *ctx, const lines &arguments, GError **error);

// Writes databases that nobody changed: "users", "groups" or both.
static gboolean rewrite(usermgmt_ctx *ctx, const lines &arguments, GError **error) {
    for (const std::string &what : arguments) {
        ctx->user_db.dirty = ctx->user_db.dirty || what == "users";
        ctx->group_db.dirty = ctx->group_db.dirty || what == "groups";
    }
    return usermgmt_sync(ctx, error);
}

static const std::map<std::string, operation> operations = {
    {"rewrite", rewrite},
};

static std::string text_of(const fs::path &file) {
    std::ostringstream text;
    text << std::ifstream(file, std::ios::binary).rdbuf();
    return text.str();
}

static lines lines_of(const fs::path &file) {
    lines found;
    std::ifstream stream(file);
    for (std::string line; std::getline(stream, line);)
        found.push_back(line);
    return found;
}

static lines golden_cases() {
    lines names;
    std::error_code ignored;
    for (const fs::directory_entry &entry : fs::directory_iterator(GOLDEN_DIR, ignored))
        if (entry.is_directory(ignored))
            names.push_back(entry.path().filename().string());
    std::sort(names.begin(), names.end());
    return names;
}

class Golden : public AccountFiles, public testing::WithParamInterface<std::string> {
  protected:
    static fs::path folder() { return fs::path(GOLDEN_DIR) / GetParam(); }

    static std::map<std::string, std::string> files_of(const fs::path &directory) {
        std::map<std::string, std::string> files;
        std::error_code ignored;
        for (const fs::directory_entry &entry : fs::directory_iterator(directory, ignored)) {
            const std::string name = entry.path().filename().string();
            const std::string text = text_of(entry.path());
            files[name] = name == "group" ? with_members_sorted(text) : text;
        }
        return files;
    }

    // Runs the case's operation on the files of etc; its error.
    static std::string run() {
        const lines call = lines_of(folder() / "call");
        const auto found = operations.find(call.empty() ? "" : call[0]);
        if (found == operations.end())
            return "the case calls no known operation";
        error_slot error;
        const open_context ctx(usermgmt_open(USERMGMT_OPEN_TRYLOCK, error.out()));
        if (ctx != nullptr) {
            const lines arguments(call.begin() + 1, call.end());
            const bool succeeded = found->second(ctx.get(), arguments, error.out()) != FALSE;
            EXPECT_EQ(succeeded, !error.is_set());
        }
        return error.text();
    }

    static std::map<std::string, std::string> expected_files() {
        const fs::path after = folder() / "after";
        std::error_code ignored;
        return files_of(fs::exists(after, ignored) ? after : folder() / "before");
    }
};

TEST_P(Golden, FilesErrorAndLogAreAsExpected) {
    const auto before = files_of(folder() / "before");
    ASSERT_FALSE(before.empty());
    for (const auto &[name, text] : before)
        write(name, text_of(folder() / "before" / name));

    std::string error = run();
    error += error.empty() ? "" : "\n";
    EXPECT_EQ(error, text_of(folder() / "error"));
    EXPECT_EQ(files_of("etc"), expected_files());
    EXPECT_EQ(take_syslog(), lines_of(folder() / "log"));
}

static std::string case_name(const testing::TestParamInfo<std::string> &info) {
    std::string name = info.param;
    std::replace_if(
        name.begin(), name.end(), [](char c) { return !g_ascii_isalnum(c); }, '_');
    return name;
}

INSTANTIATE_TEST_SUITE_P(Cases, Golden, testing::ValuesIn(golden_cases()), case_name);

TEST(GoldenCases, AreFound) {
    EXPECT_FALSE(golden_cases().empty()) << GOLDEN_DIR;
}

// What a rewrite left is how the files stay.
TEST_P(Golden, RewrittenFilesStayAsTheyAre) {
    if (lines_of(folder() / "call").at(0) != "rewrite" || !text_of(folder() / "error").empty())
        return;
    const auto after = expected_files();
    for (const auto &[name, text] : after)
        write(name, text);
    EXPECT_EQ(run(), "");
    EXPECT_EQ(files_of("etc"), after);
    (void)take_syslog();
}
