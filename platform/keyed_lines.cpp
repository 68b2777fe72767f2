// platform/keyed_lines.cpp: changes the entries of a text or a file of lines.
#include "platform/keyed_lines.h"

#include <algorithm>
#include <type_traits>

#include <glib.h>

struct pending_change {
    const line_change *change;
    bool done;  // written, or a later change of the same key takes its place
};
static_assert(std::is_trivial_v<pending_change>);

// The changes in their order, and, for finding them by key, in the order of the keys.
class pending_changes {
  public:
    explicit pending_changes(std::span<const line_change> changes);
    ~pending_changes();
    pending_changes(const pending_changes &) = delete;
    pending_changes &operator=(const pending_changes &) = delete;

    std::span<pending_change> all() { return {rows_, count_}; }
    // Null where the key is not to be changed.
    pending_change *find(std::string_view key);

  private:
    std::size_t count_;
    pending_change *rows_;
    pending_change **by_key_;
};

// Equal keys stay in the order of their changes.
static bool comes_before(const pending_change *one, const pending_change *other) {
    const int order = one->change->key.compare(other->change->key);

    return order != 0 ? order < 0 : one < other;
}

pending_changes::pending_changes(std::span<const line_change> changes)
    : count_(changes.size()),
      rows_(g_new0(pending_change, count_)),
      by_key_(g_new0(pending_change *, count_)) {
    for (std::size_t i = 0; i < count_; i++) {
        rows_[i].change = &changes[i];
        by_key_[i] = &rows_[i];
    }
    std::sort(by_key_, by_key_ + count_, comes_before);
    for (std::size_t i = 1; i < count_; i++) {
        if (by_key_[i - 1]->change->key == by_key_[i]->change->key)
            by_key_[i - 1]->done = true;
    }
}

pending_changes::~pending_changes() {
    g_free(by_key_);
    g_free(rows_);
}

pending_change *pending_changes::find(std::string_view key) {
    pending_change **end = by_key_ + count_;
    pending_change **behind =
        std::upper_bound(by_key_, end, key, [](std::string_view wanted, const pending_change *row) {
            return wanted < row->change->key;
        });

    if (behind == by_key_ || behind[-1]->change->key != key)
        return nullptr;
    return behind[-1];
}

static void append_change(pending_change *row, wiped_text *out_text) {
    if (!row->done && !row->change->line.empty()) {
        out_text->append(row->change->line);
        out_text->append("\n");
    }
    row->done = true;
}

void keyed_lines_apply(std::string_view text, const line_format &format,
                       std::span<const line_change> changes, wiped_text *out_text) {
    pending_changes pending(changes);
    wiped_text scratch;
    bool takes_next = false;  // of the last line that was kept

    while (!text.empty()) {
        const found_line line = format.read(text, &scratch);
        pending_change *row = line.is_entry ? pending.find(line.key) : nullptr;

        if (row != nullptr) {
            append_change(row, out_text);
        } else {
            out_text->append(text.substr(0, line.length));
            if (text[line.length - 1] != '\n')
                out_text->append("\n");
            takes_next = line.takes_next;
        }
        text.remove_prefix(line.length);
    }
    for (pending_change &row : pending.all()) {
        // A line with a blank ends the one before; an empty line would itself be taken by it.
        if (takes_next && !row.done && !row.change->line.empty()) {
            out_text->append(" \n");
            takes_next = false;
        }
        append_change(&row, out_text);
    }
}

file_result keyed_lines_update(const char *path, const line_format &format,
                               std::span<const line_change> changes) {
    atomic_file file(path);
    wiped_text old_text;
    wiped_text new_text;
    file_access access = {};

    if (const file_result result = file.lock(); result != file_result::DONE)
        return result;
    if (const file_result result = file.read(&old_text); result != file_result::DONE)
        return result;

    keyed_lines_apply(old_text.view(), format, changes, &new_text);
    // What stands there may be of a replacement that was not synced and could not be taken back.
    if (new_text.view() == old_text.view())
        return file.sync_folder();

    if (!file.exists()) {
        gid_t folder_group = 0;
        if (const file_result result = file.folder_group(&folder_group);
            result != file_result::DONE)
            return result;
        access = format.access_of_new_file(folder_group);
    }
    const file_result result = file.replace(new_text.view(), access);
    // Whoever is told of a failure goes by the old entries.
    if (result == file_result::NOT_SYNCED)
        file.take_back(old_text.view());
    return result;
}
