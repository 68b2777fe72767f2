// tests/unit/usermgmt/core_file_table.cpp: the account files of a test, below its working folder.
#include "usermgmt/core_file.h"
#include "usermgmt/core_file_records.h"

const core_file core_file_table[CORE_FILE_COUNT] = {
    {CORE_FILE_ROW_PASSWD, "passwd", "etc/passwd", fetch_passwd, write_passwd, free_passwd},
    {CORE_FILE_ROW_SHADOW, "shadow", "etc/shadow", fetch_shadow, write_shadow, free_shadow},
    {CORE_FILE_ROW_GROUP,  "group",  "etc/group",  fetch_group,  write_group,  free_group },
};
