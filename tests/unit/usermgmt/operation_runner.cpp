// tests/unit/usermgmt/operation_runner.cpp: runs operations and checks after each that memory and
// files hold what they have to hold.
#include "tests/unit/usermgmt/operation_runner.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "tests/unit/usermgmt/operation_call.h"

operation_runner::operation_runner() {
    sources_.stand_in = cheap_hash;
    sources_.pid = 42;
    sources_.ticks = 0;
}

// The text is only read of a file that is not the one that was there before.
static lying_file look_at(int row, const lying_file &before) {
    struct stat st = {};
    if (stat(core_file_table[row].path, &st) != 0)
        return {};
    lying_file now = {st.st_ino, st.st_mode & 07777U, st.st_size,
                      st.st_ctim.tv_sec * 1000000000 + st.st_ctim.tv_nsec, ""};
    const bool same =
        now.inode == before.inode && now.size == before.size && now.changed == before.changed;
    now.text = same ? before.text : read_account_text(row);
    return now;
}

std::string operation_runner::start(const starting_files &files, char salt_letter) {
    ctx_.reset();
    (void)unlink(core_file_table[CORE_FILE_ROW_SHADOW].path);
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        if (row != CORE_FILE_ROW_SHADOW || files.has_shadow)
            create_account_file(row, files.texts[row], files.modes[row]);
        files_[row] = look_at(row, {});
    }
    sources_.now = 20000 * 86400;
    sources_.random = std::string(10, salt_letter);
    model_.emplace(read_account_files(), files.open_flags);
    roots_hashes_ = {"$6$rootsalt$roothash"};
    open_flags_ = files.open_flags;

    error_slot error;
    ctx_.reset(usermgmt_open(files.open_flags | USERMGMT_OPEN_TRYLOCK, error.out()));
    (void)take_syslog();  // the lines that were skipped
    return error.is_set() ? error.text() : model_->difference_from(ctx_.get());
}

void operation_runner::count(const operation &what, const operation_result &result) {
    const auto kind = static_cast<std::size_t>(what.kind);
    (result.succeeded ? succeeded_ : result.fault_struck ? struck_ : refused_)[kind]++;
}

// Files that another program changed are never seen here, and what was loaded before is only told
// of when it is loaded again.
std::string operation_runner::check_logs(const operation_result &result) {
    const bool mismatch = result.error.find("out of sync") != std::string::npos ||
                          result.error.find(", primary group (") != std::string::npos;
    for (const std::string &line : take_syslog())
        if (!(model_->reloaded() || mismatch) ||
            line.find("changed by another program") != std::string::npos)
            return "logged " + line;
    return "";
}

std::string operation_runner::check_lines(int row) {
    account_lines read;
    read_account_lines(row, &read);
    const account_lines &expected = model_->disk();
    const bool same = row == CORE_FILE_ROW_PASSWD   ? read.passwd == expected.passwd
                      : row == CORE_FILE_ROW_SHADOW ? read.shadow == expected.shadow
                                                    : read.group == expected.group;
    return same ? "" : std::string("other records in ") + core_file_table[row].name;
}

std::string operation_runner::check_files() {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const std::string name = core_file_table[row].name;
        lying_file now = look_at(row, files_[row]);
        if ((now.inode != files_[row].inode) != model_->replaced(row))
            return name + (model_->replaced(row) ? " was not replaced" : " was replaced");
        if (now.mode != files_[row].mode)
            return name + " has another mode";
        if (now.text != model_->disk().texts[row])
            return name + " holds\n" + now.text + "instead of\n" + model_->disk().texts[row];
        if (access((core_file_table[row].path + std::string(".tmp")).c_str(), F_OK) == 0)
            return name + " has left a temporary file";
        files_[row] = std::move(now);
        const std::string other_lines = model_->replaced(row) ? check_lines(row) : "";
        if (!other_lines.empty())
            return other_lines;
    }
    return check_root();
}

// Nobody else becomes root, and root changes only by a password of its own.
std::string operation_runner::check_root() const {
    const account_lines &disk = model_->disk();
    // The line may be the last one and lack its end.
    if (!(files_[CORE_FILE_ROW_PASSWD].text + "\n").starts_with("root:x:0:0:root:/root:/bin/sh\n"))
        return "root's passwd line changed";
    for (const passwd_line &line : disk.passwd)
        if ((line.uid == 0) != (&line == &disk.passwd[0]) ||
            (line.name == "root") != (&line == &disk.passwd[0]))
            return "a second root";
    const bool has_known_hash =
        !disk.has_shadow ||
        std::any_of(roots_hashes_.begin(), roots_hashes_.end(), [this](const std::string &hash) {
            const std::string &text = files_[CORE_FILE_ROW_SHADOW].text;
            return text.starts_with("root:" + hash + ":");
        });
    return has_known_hash ? "" : "root's shadow line changed";
}

std::string operation_runner::reopen() {
    error_slot error;
    ctx_.reset();
    ctx_.reset(usermgmt_open(open_flags_ | USERMGMT_OPEN_TRYLOCK, error.out()));
    return error.text();
}

std::string operation_runner::run(const operation &what) {
    *sources_.now += what.seconds_later;
    sources_.hashes.clear();
    sources_.settings.clear();
    sources_.reads.clear();
    glib_warnings_ = 0;
    const std::size_t expected_warnings =
        what.kind == operation_kind::modify_user && what.account
            ? (model_->users_dirty() ? 1U : 0U) + (model_->groups_dirty() ? 1U : 0U)
            : 0U;

    operation_result result = {};
    result.now = *sources_.now;
    if (what.kind == operation_kind::reopen) {
        result.error = reopen();
        result.succeeded = result.error.empty();
        model_->reopen();
    } else {
        error_slot error;
        std::optional<io_trace> trace;
        if (what.fault) {
            trace.emplace();
            trace->fail(what.fault->call, what.fault->path, what.fault->nth, EIO);
        }
        lines warnings;
        result.succeeded = call_operation(ctx_.get(), what, &warnings, error.out());
        glib_warnings_ = warnings.size();
        result.fault_struck = trace && trace->has_struck();
        result.error = error.text();
        result.new_hash = sources_.hashes.empty() ? "" : sources_.hashes.back();
        if (what.account == "root" && !result.new_hash.empty())
            roots_hashes_.push_back(result.new_hash);
        model_->follow(what, result);
    }
    count(what, result);

    if (result.succeeded != result.error.empty() || (result.fault_struck && result.succeeded))
        return "ended with " + std::to_string(result.succeeded) + " and the error " + result.error;
    if (glib_warnings_ != expected_warnings)
        return "warned " + std::to_string(glib_warnings_) + " times";
    for (const std::string &fault : {model_->objection(), check_logs(result),
                                     model_->difference_from(ctx_.get()), check_files()})
        if (!fault.empty())
            return fault + "\nThe error: " + result.error;
    return "";
}
