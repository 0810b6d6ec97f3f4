// Stand-in for the appliance's audio configuration store.
//
// The store is one text file, VEXO_AUDIO_CONF_PATH, of key=value lines:
// - A line ends at a newline; the last line may lack one. A line holds at
//   most 1023 characters before its newline.
// - Lines without '=' (blank ones included) are ignored, and so are lines
//   whose key begins with '#' (comments).
// - The key is the text before the first '=', without the white space around
//   it. Keys match exactly, case included.
// - The value is the text after the first '=', without the white space around
//   it (space, tab, carriage return, vertical tab, form feed). When what is
//   left is at least two characters long and begins and ends with the same
//   quote, " or ', the two quotes are dropped and the text between them is
//   kept exactly, white space included: key=" yes " gives " yes ". There are
//   no escapes; any other quote is an ordinary character.
// - When several lines set one key, the last of them counts.
#pragma once

#include "common/paths.hpp"

// Size of the buffer a value is read into by the audio client: a value has at
// most 1023 characters.
inline constexpr int VEXO_AUDIO_CONF_VALUE_MAX = 1024;

// Reads the value of key into buffer (size bytes) as zero-terminated text.
// Returns 1 on success; 0 when the file or the key is missing; -1 for a
// missing key or buffer, a size below 1, a file that cannot be read, a value
// longer than size - 1 characters, or a line of the key longer than 1023
// characters. buffer is written only when the result is 1.
int VEXOAudioConfGet(const char* key, char* buffer, int size);
