// tests/fuzz/digest_file_fuzz.cpp: changes to a digest file of any content. The input is the file
// and, in a second part, a user to set or, behind a "-", to remove in each line.
#include <algorithm>

#include "platform/digest_entry/digest_lines.h"
#include "tests/fuzz/fuzz.h"

static constexpr line_format FORMAT = {digest_read_line, nullptr};
static constexpr std::string_view HASH = ":PRIVANE:0123456789abcdef0123456789abcdef";

struct entry {
    bool is_entry;
    std::string key;
    std::string_view text;  // a part of the file
};

static std::vector<entry> entries_of(std::string_view text) {
    std::vector<entry> entries;
    wiped_text scratch;
    entries.reserve(static_cast<std::size_t>(std::count(text.begin(), text.end(), '\n')) + 1);
    while (!text.empty()) {
        const found_line line = digest_read_line(text, &scratch);
        hold(line.length > 0 && line.length <= text.size(), "a line ends within the text", text);
        hold(line.length == text.size() || text[line.length - 1] == '\n',
             "a line ends with its line end", text);
        entries.push_back({line.is_entry, line.is_entry ? std::string(line.key) : "",
                           text.substr(0, line.length)});
        text.remove_prefix(line.length);
    }
    return entries;
}

// Nothing that Apache joins, cuts or trims.
static bool is_plain(std::string_view text) {
    return text.find_first_of(std::string_view("\\\0\t\v\f\r #", 8)) == std::string_view::npos &&
           text.find("::") == std::string_view::npos &&
           text.find("\n:") == std::string_view::npos && !text.starts_with(':');
}

// The same text by the simplest means.
static std::string plainly_changed(std::string_view text, const std::vector<line_change> &changes) {
    std::string changed;
    std::vector<bool> is_done(changes.size(), false);
    const auto last_of = [&changes](std::string_view key) {
        std::size_t found = changes.size();
        for (std::size_t i = 0; i < changes.size(); i++)
            if (changes[i].key == key)
                found = i;
        return found;
    };
    const auto put_line = [&changed](std::string_view line) {
        changed += line;
        changed += '\n';
    };
    const auto put = [&](std::size_t i) {
        if (!is_done[i] && !changes[i].line.empty())
            put_line(changes[i].line);
        is_done[i] = true;
    };
    views words;
    for (const std::string_view line : lines_of(text)) {
        split_into(line, ':', &words);
        const bool is_entry = words.size() > 1 && words[1] == DIGEST_REALM;
        const std::size_t change = is_entry ? last_of(words[0]) : changes.size();
        if (change < changes.size())
            put(change);
        else
            put_line(line);
    }
    for (std::size_t i = 0; i < changes.size(); i++)
        if (last_of(changes[i].key) == i)
            put(i);
    return changed;
}

static bool is_changed(const std::vector<line_change> &changes, const entry &one) {
    return one.is_entry &&
           std::any_of(changes.begin(), changes.end(),
                       [&one](const line_change &change) { return change.key == one.key; });
}

// What is not to be changed, with an end to its last line.
static std::string kept(const std::vector<entry> &entries,
                        const std::vector<line_change> &changes) {
    std::string texts;
    for (const entry &one : entries)
        if (!is_changed(changes, one))
            texts += one.text;
    if (!texts.empty() && texts.back() != '\n')
        texts += '\n';
    return texts;
}

static std::string applied(std::string_view text, const std::vector<line_change> &changes) {
    wiped_text changed;
    keyed_lines_apply(text, FORMAT, changes, &changed);
    return std::string(changed.view());
}

static void check_keys(const std::vector<entry> &after, const std::vector<line_change> &changes) {
    for (auto change = changes.begin(); change != changes.end(); ++change) {
        const bool is_last = std::none_of(change + 1, changes.end(), [&](const line_change &later) {
            return later.key == change->key;
        });
        if (!is_last)
            continue;
        views lines;
        for (const entry &one : after)
            if (one.is_entry && one.key == change->key)
                lines.push_back(one.text);
        if (change->line.empty())
            hold(lines.empty(), "a user that was removed has no entry", change->key);
        else
            hold(lines.size() == 1 && lines[0].starts_with(change->line) &&
                     lines[0].substr(change->line.size()) == "\n",
                 "a user that was set has that entry and no other", change->key);
    }
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const std::vector<std::string> parts = parts_of(data, size);
    const std::string &text = parts[0];
    // Which the changes point into.
    std::vector<std::string> lines;
    std::vector<line_change> changes;

    for (const std::string_view one : lines_of(parts.size() > 1 ? parts[1] : std::string_view()))
        lines.emplace_back(one);
    for (std::string &line : lines) {
        line.resize(std::min(line.size(), line.find('\0')));  // as a caller gives it
        line = line.starts_with('-') ? line.substr(1) : line + std::string(HASH);
    }
    for (const std::string &line : lines) {
        const std::string_view all = line;
        const bool is_set = all.ends_with(HASH);
        const std::string_view key = is_set ? all.substr(0, all.size() - HASH.size()) : all;
        if (digest_is_user(key))
            changes.push_back({key, is_set ? all : std::string_view()});
    }

    const std::string changed = applied(text, changes);
    const std::vector<entry> after = entries_of(changed);
    hold(changed.empty() || changed.back() == '\n', "the last line has an end", changed);
    check_keys(after, changes);
    const std::string before = kept(entries_of(text), changes);
    const std::string still = kept(after, changes);
    // A line that took the next one was given an end.
    const bool is_ended =
        still.ends_with(" \n") && std::string_view(still).substr(0, still.size() - 2) == before;
    hold(still == before || is_ended, "whatever else is in the file stays byte for byte", text);
    hold(applied(changed, changes) == changed, "the same changes again change nothing", changed);
    if (is_plain(text)) {
        const std::string expected = plainly_changed(text, changes);
        hold(changed == expected, "a plain file becomes what it should",
             [&] { return changed + "\ninstead of\n" + expected; });
    }
    return 0;
}
