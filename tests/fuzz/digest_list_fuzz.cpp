// tests/fuzz/digest_list_fuzz.cpp: any list of users, to be set in a digest file and to be removed
// from it. The input is the list and, in a second part, the file.
#include <algorithm>
#include <memory>
#include <span>

#include "platform/digest_entry/digest_lines.h"
#include "tests/fuzz/fuzz.h"

static constexpr line_format FORMAT = {digest_read_line, nullptr};
static constexpr std::string_view MIDDLE = ":PRIVANE:";
static constexpr std::size_t DIGITS = 32;
static constexpr std::size_t MAX_NAME = 255;

using reader = bool (*)(std::string_view list, GArray *out_changes);

struct array_free {
    void operator()(GArray *array) const { g_array_unref(array); }
};
using change_array = std::unique_ptr<GArray, array_free>;

static std::span<const line_change> all(const change_array &changes) {
    return {reinterpret_cast<const line_change *>(changes->data), changes->len};
}

static bool is_name(std::string_view text) {
    return !text.empty() && text.size() <= MAX_NAME && text.front() != '#' &&
           !has_only(text.substr(0, 1), " \t\n\v\f\r") &&
           text.find_first_of(":\r\n") == std::string_view::npos;
}

// The name of a whole entry; "" where the line is none.
static std::string_view name_in_entry(std::string_view line) {
    const std::size_t colon = line.find(':');
    if (colon == std::string_view::npos)
        return "";
    const std::string_view rest = line.substr(colon);
    const bool is_entry = rest.starts_with(MIDDLE) && rest.size() == MIDDLE.size() + DIGITS &&
                          has_only(rest.substr(MIDDLE.size()), "0123456789abcdef");
    return is_entry && is_name(line.substr(0, colon)) ? line.substr(0, colon) : "";
}

static void check_list(std::string_view list, reader read, bool takes_names, bool keeps_lines) {
    const change_array changes(g_array_new(FALSE, FALSE, sizeof(line_change)));
    const bool accepted = read(list, changes.get());
    views names;
    const views lines = lines_of(list);

    names.reserve(lines.size());
    for (const std::string_view line : lines)
        names.push_back(takes_names && is_name(line) ? line : name_in_entry(line));
    const bool is_valid = std::find(names.begin(), names.end(), "") == names.end();
    hold(accepted == is_valid, "a list is taken when every line of it is valid", list);
    if (!accepted)
        return;
    hold(changes->len == names.size(), "every line is one change", list);
    for (std::size_t i = 0; i < names.size(); i++) {
        const line_change &change = all(changes)[i];
        hold(change.key == names[i] && change.line == (keeps_lines ? lines[i] : ""),
             "a change is about the user of its line", lines[i]);
    }
}

static std::string after(std::string_view file, std::string_view list, reader read) {
    const change_array changes(g_array_new(FALSE, FALSE, sizeof(line_change)));
    wiped_text changed;

    (void)read(list, changes.get());
    keyed_lines_apply(file, FORMAT, all(changes), &changed);
    return std::string(changed.view());
}

static std::size_t count_entries(std::string_view file, std::string_view user) {
    wiped_text scratch;
    std::size_t count = 0;
    while (!file.empty()) {
        const found_line line = digest_read_line(file, &scratch);
        count += line.is_entry && line.key == user ? 1U : 0U;
        file.remove_prefix(line.length);
    }
    return count;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const std::vector<std::string> parts = parts_of(data, size);
    // As a caller gives it: up to the first NUL.
    const std::string list = parts[0].c_str();
    const std::string file = parts.size() > 1 ? parts[1] : "";

    check_list(list, digest_read_set_list, false, true);
    check_list(list, digest_read_delete_list, true, false);

    const change_array changes(g_array_new(FALSE, FALSE, sizeof(line_change)));
    if (!digest_read_set_list(list, changes.get()))
        return 0;
    const std::string with = after(file, list, digest_read_set_list);
    const std::string without = after(with, list, digest_read_delete_list);
    for (const line_change &change : all(changes)) {
        hold(count_entries(with, change.key) == 1, "each user of a list has one entry", change.key);
        hold(count_entries(without, change.key) == 0, "the list removes whom it set", change.key);
    }
    return 0;
}
