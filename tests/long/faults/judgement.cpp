// tests/long/faults/judgement.cpp: whether files that are replaced whole are what they may be.
#include "tests/long/faults/judgement.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <map>
#include <sstream>

#include <sys/stat.h>

#include <glib.h>

static constexpr mode_t MODE_BITS = 07777;
static constexpr mode_t PRIVATE_MODE = 0600;

static std::string folder_part(const std::string &path) {
    const std::size_t slash = path.rfind('/');
    return slash != path.npos ? path.substr(0, slash) : ".";
}

static std::string name_part(const std::string &path) {
    return path.substr(path.rfind('/') + 1);
}

static bool is_call(const trapped_call &call, const char *name) {
    return call.result >= 0 && std::strcmp(call.name, name) == 0;
}

// What is not yet on the disk, with what it waits for.
struct unsynced {
    std::map<std::string, bool> written;  // a path, whether it was synced since
    std::vector<std::string> folders;     // of renames
};

static std::string first_unsynced(const unsynced &state) {
    for (const auto &[path, synced] : state.written)
        if (!synced)
            return path;
    return "";
}

static std::string judge_call(const trapped_call &call, unsynced *state) {
    const std::string path = call.path;
    if (is_call(call, "write") || (is_call(call, "open") && is_temporary(path))) {
        state->written[path] = false;
    } else if (is_call(call, "fsync")) {
        state->written[path] = true;
        std::erase(state->folders, path);
    } else if (is_call(call, "rename")) {
        if (const std::string early = first_unsynced(*state); !early.empty())
            return "renamed " + path + " before " + early + " was synced";
        if (!state->folders.empty())
            return "renamed " + path + " before the folder was synced";
        state->folders.push_back(folder_part(path));
    } else if (is_call(call, "unlink")) {
        state->written.erase(path);
    }
    return "";
}

std::string judge_order_of_calls(const call_trace &trace) {
    unsynced state;
    if (!trace.is_whole())
        return "more calls than can be recorded";
    for (int i = 0; i < trace.count; i++)
        if (const std::string wrong = judge_call(trace.calls[i], &state); !wrong.empty())
            return wrong;
    if (const std::string late = first_unsynced(state); !late.empty())
        return "succeeded before " + late + " was synced";
    return state.folders.empty() ? "" : "succeeded before " + state.folders[0] + " was synced";
}

// The mode that a temporary file of this replacement has by now; 0 where it was not made yet.
static mode_t mode_by_now(const stopped_replacement &stopped, const std::string &name) {
    mode_t mode = 0;
    for (int i = 0; i < std::min(stopped.calls, stopped.trace->count); i++) {
        const trapped_call &call = stopped.trace->calls[i];
        if (name_part(call.path) != name)
            continue;
        if (is_call(call, "open"))
            mode = PRIVATE_MODE;
        else if (is_call(call, "fchmod"))
            mode = call.mode;
    }
    return mode;
}

static std::string judge_temporary(const stopped_replacement &stopped, const std::string &name,
                                   const lying_file &file) {
    const mode_t mode = mode_by_now(stopped, name);
    const auto leftover = stopped.before->find(name);
    if (mode == 0) {
        return leftover != stopped.before->end() && leftover->second == file
                   ? ""
                   : name + " was there before it was made";
    }
    const auto live = stopped.before->find(name.substr(0, name.size() - 4));
    const auto made = stopped.after->find(name.substr(0, name.size() - 4));
    const lying_file *model = live != stopped.before->end()  ? &live->second
                              : made != stopped.after->end() ? &made->second
                                                             : nullptr;
    if (!S_ISREG(file.mode) || (file.mode & MODE_BITS) != mode)
        return name + " has another mode than was set";
    if (mode != PRIVATE_MODE && (model == nullptr || mode != (model->mode & MODE_BITS)))
        return name + " has a mode that is neither private nor the file's";
    return "";
}

static std::string judge_live(const stopped_replacement &stopped, const std::string &name,
                              const lying_file *file, bool *out_is_new) {
    const auto old = stopped.before->find(name);
    const auto made = stopped.after->find(name);
    const lying_file *first = old != stopped.before->end() ? &old->second : nullptr;
    const lying_file *second = made != stopped.after->end() ? &made->second : nullptr;

    *out_is_new = false;
    if (file == nullptr)
        return first == nullptr ? "" : name + " is gone";
    if (first != nullptr && *file == *first)
        return "";
    *out_is_new = true;
    if (second != nullptr && *file == *second)
        return "";
    folder_state wanted;
    if (second != nullptr)
        wanted[name] = *second;
    return name + " is neither the old nor the new one:" +
           state_difference(wanted,
                            {
                                {name, *file}
    },
                            true);
}

std::string judge_files(const stopped_replacement &stopped, const folder_state &now) {
    std::string still_old;
    for (const std::string &name : stopped.order) {
        const auto found = now.find(name);
        bool is_new = false;
        const lying_file *file = found != now.end() ? &found->second : nullptr;
        const std::string wrong = judge_live(stopped, name, file, &is_new);
        if (!wrong.empty())
            return wrong;
        if (is_new && !still_old.empty())
            return name + " is the new one, but " + still_old + " before it is the old one";
        const auto old = stopped.before->find(name);
        const auto made = stopped.after->find(name);
        const bool changes = made != stopped.after->end() &&
                             (old == stopped.before->end() || old->second != made->second);
        if (changes && !is_new)
            still_old = name;
    }
    for (const auto &[name, file] : now) {
        if (is_temporary(name)) {
            if (const std::string wrong = judge_temporary(stopped, name, file); !wrong.empty())
                return wrong;
        } else if (std::find(stopped.order.begin(), stopped.order.end(), name) ==
                       stopped.order.end() &&
                   std::find(stopped.may_appear.begin(), stopped.may_appear.end(), name) ==
                       stopped.may_appear.end()) {
            return name + " appeared";
        }
    }
    return "";
}

static std::string text_in(const folder_state &state, const std::string &name) {
    const auto found = state.find(name);
    return found != state.end() ? found->second.text : "";
}

// The lines that make somebody root.
static std::string lines_of_root(const std::string &passwd) {
    std::string found;
    std::istringstream stream(passwd);
    for (std::string line; std::getline(stream, line);) {
        const std::size_t uid = line.find(':', line.find(':') + 1) + 1;
        const bool is_zero = uid != 0 && std::strtoul(line.c_str() + uid, nullptr, 10) == 0 &&
                             g_ascii_isdigit(line[uid]);
        if (line.starts_with("root:") || is_zero)
            found += line + "\n";
    }
    return found;
}

static std::string hash_of_root(const std::string &shadow) {
    const std::string text = "\n" + shadow;
    const std::size_t start = text.find("\nroot:");
    return start != text.npos ? text.substr(start + 6, text.find(':', start + 6) - start - 6) : "";
}

std::string judge_root(const folder_state &before, const folder_state &after,
                       const folder_state &now) {
    const std::string lines = lines_of_root(text_in(now, "passwd"));
    if (!lines.starts_with("root:") || std::count(lines.begin(), lines.end(), '\n') != 1 ||
        lines != lines_of_root(text_in(before, "passwd")))
        return "root's line is now " + lines;
    const std::string hash = hash_of_root(text_in(now, "shadow"));
    if (hash.empty() || (hash != hash_of_root(text_in(before, "shadow")) &&
                         hash != hash_of_root(text_in(after, "shadow"))))
        return "root's hash is now '" + hash + "'";
    return "";
}
