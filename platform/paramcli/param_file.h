// platform/paramcli/param_file.h: storing an option block in a file anywhere; internal.
#pragma once

struct paramcli_options;

// As paramcli_sync. 0, or a number of paramcli.h. The path is absolute.
int param_file_sync(const char *path, paramcli_options *options);
