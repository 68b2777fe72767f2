// usermgmt/name_set.h: lists and sets of names, internal to usermgmt.
//
// A list is a NULL-terminated string vector; a set is a hash table whose keys are the names.
#pragma once

#include <glib.h>

// An absent list holds nothing.
gboolean list_contains(const char *string, const char *const *list);

// Puts each element of a into both where b contains it, else into only. The sets borrow the
// strings.
void list_membership_to_hash(const char *const *a, const char *const *b, GHashTable *both,
                             GHashTable *only);

// A list of copies of the names, in no particular order.
GList *str_hash_to_glist(GHashTable *set);

// Stores the names in *dst, which must be null: as copies that the array owns or borrowed from the
// set, with a terminating null where asked.
void str_hash_to_ptr_array(GHashTable *set, GPtrArray **dst, gboolean terminate, gboolean copy);

// The three lists are the caller's: g_list_free_full(…, g_free).
void list_diff(const char *const *a, const char *const *b, GList **out_only_a, GList **out_both,
               GList **out_only_b);
