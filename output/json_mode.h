// output/json_mode.h: the values of the option --json; shared by the programs that people start.
#pragma once

enum class json_mode { OFF, SHORT, PRETTY };

// What a person may write for it, as a message says it.
inline constexpr const char *JSON_MODE_WORDS = "short, pretty or off";

// False where the word is none of them; *out_mode is as it was then.
bool json_mode_find(const char *word, json_mode *out_mode);
