// usermgmt/name_set.cpp: lists and sets of names.
#include "usermgmt/name_set.h"

#include "usermgmt/precondition.h"

gboolean list_contains(const char *string, const char *const *list) {
    if (list == nullptr)
        return FALSE;
    for (; *list != nullptr; list++)
        if (g_str_equal(*list, string))
            return TRUE;
    return FALSE;
}

// g_hash_table_add takes non-constant keys and leaves them alone.
static void add_borrowed(GHashTable *set, const char *name) {
    (void)g_hash_table_add(set, const_cast<char *>(name));
}

void list_membership_to_hash(const char *const *a, const char *const *b, GHashTable *both,
                             GHashTable *only) {
    if (a == nullptr)
        return;
    for (; *a != nullptr; a++)
        add_borrowed(list_contains(*a, b) ? both : only, *a);
}

GList *str_hash_to_glist(GHashTable *set) {
    GList *list = nullptr;
    GHashTableIter iter;
    gpointer name;
    g_hash_table_iter_init(&iter, set);
    while (g_hash_table_iter_next(&iter, &name, nullptr))
        list = g_list_prepend(list, g_strdup(static_cast<const char *>(name)));
    return list;
}

void str_hash_to_ptr_array(GHashTable *set, GPtrArray **dst, gboolean terminate, gboolean copy) {
    require(dst != NULL, );
    require(*dst == NULL, );

    const guint size = g_hash_table_size(set) + (terminate ? 1 : 0);
    GPtrArray *array = g_ptr_array_new_full(size, copy ? g_free : nullptr);
    GHashTableIter iter;
    gpointer name;
    g_hash_table_iter_init(&iter, set);
    while (g_hash_table_iter_next(&iter, &name, nullptr))
        g_ptr_array_add(array, copy ? g_strdup(static_cast<const char *>(name)) : name);
    if (terminate)
        g_ptr_array_add(array, nullptr);
    *dst = array;
}

void list_diff(const char *const *a, const char *const *b, GList **out_only_a, GList **out_both,
               GList **out_only_b) {
    g_autoptr(GHashTable) only_a = g_hash_table_new(g_str_hash, g_str_equal);
    g_autoptr(GHashTable) both = g_hash_table_new(g_str_hash, g_str_equal);
    g_autoptr(GHashTable) only_b = g_hash_table_new(g_str_hash, g_str_equal);

    list_membership_to_hash(a, b, both, only_a);
    list_membership_to_hash(b, a, both, only_b);
    *out_only_a = str_hash_to_glist(only_a);
    *out_both = str_hash_to_glist(both);
    *out_only_b = str_hash_to_glist(only_b);
}
