// usermgmt/record_block.h: a record and its strings in one block of memory, internal to usermgmt.
//
// Each line of the account files becomes such records, and they are kept: a block for every string
// would cost more than the string.
#pragma once

#include <cstddef>
#include <cstring>
#include <type_traits>

#include <glib.h>

// The bytes that the record's strings take behind it.
template <typename record, std::size_t count>
std::size_t room_for_texts(const record *source, char *record::*const (&texts)[count]) {
    std::size_t room = 0;
    for (char *record::*text : texts)
        if (source->*text != nullptr)
            room += std::strlen(source->*text) + 1;
    return room;
}

// A copy for g_free, with those strings behind it; absent ones stay absent. Other pointers stay as
// they are.
template <typename record, std::size_t count>
record *copy_with_texts(const record *source, char *record::*const (&texts)[count]) {
    static_assert(std::is_trivial_v<record>);
    auto *copy = static_cast<record *>(g_malloc(sizeof(record) + room_for_texts(source, texts)));
    *copy = *source;
    char *room = reinterpret_cast<char *>(copy + 1);
    for (char *record::*text : texts) {
        if (source->*text == nullptr)
            continue;
        copy->*text = room;
        room = stpcpy(room, source->*text) + 1;
    }
    return copy;
}
