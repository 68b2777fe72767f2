// tests/fakes/digest_entry/fake_digest_entry.cpp: a digest library that obeys files and keeps a
// record.
//
// FAKE_DIGEST_DIRECTORY names the folder (tests/fakes/folder). A call's words are the function's
// name and its arguments. Further files:
//   result  the number that every function returns
#include "platform/digest_entry/digest_entry.h"

#include <initializer_list>
#include <string>

#include "tests/fakes/folder/fake_folder.h"

static int answer(std::initializer_list<const char *> words) {
    const char *folder = fake_folder("FAKE_DIGEST_DIRECTORY");
    fake_record(folder, {words.begin(), words.size()});
    return fake_number(folder, "result");
}

int digest_entry_set(const char *user, const char *password, int flags) {
    return answer({__func__, user, password, std::to_string(flags).c_str()});
}

int digest_entry_delete(const char *user, int flags) {
    return answer({__func__, user, std::to_string(flags).c_str()});
}

int digest_entry_set_list(const char *user_list, int flags) {
    return answer({__func__, user_list, std::to_string(flags).c_str()});
}

int digest_entry_delete_list(const char *user_list, int flags) {
    return answer({__func__, user_list, std::to_string(flags).c_str()});
}
