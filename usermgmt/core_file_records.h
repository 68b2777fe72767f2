// usermgmt/core_file_records.h: the lines of the three account files, internal to usermgmt.
//
// The functions behind the rows of core_file_table. Formats: passwd(5), shadow(5), group(5); the
// C library's own readers and writers do the work; the readers in their form for a room of the
// caller's, since with their own they take the square of a line's length.
#pragma once

#include <cstdio>

#include <glib.h>

#include "usermgmt/account_records.h"

// Each fetch returns one record with all of its strings, for the function below it to free:
// struct passwd, struct spwd, struct group.
gpointer fetch_passwd(FILE *stream);
void free_passwd(gpointer record);
gpointer fetch_shadow(FILE *stream);
void free_shadow(gpointer record);
gpointer fetch_group(FILE *stream);
void free_group(gpointer record);

// The password fields of a user's two lines. Borrowed.
const char *passwd_password(const internal_user *user);
const char *shadow_password(const internal_user *user);

// An internal_user; "x" stands for the password of a shadowed one, "*" for an absent password.
int write_passwd(const void *record, FILE *stream);
// An internal_user; one that is not shadowed writes nothing. An absent password is written "*",
// since many PAM set-ups take an empty field as "no password needed".
int write_shadow(const void *record, FILE *stream);
// An internal_group.
int write_group(const void *record, FILE *stream);
