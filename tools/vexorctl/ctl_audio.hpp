// vexorctl's audio commands: any command of the audio client's catalogue,
// sent straight to the audio daemon with its arguments typed on the command
// line, and the ten equalizer band values that `audio` and `eq` share.
#pragma once

#include <cstdint>

#include "audioctl/ctrl.hpp"

// The prefix of the audio commands' constants, which typed names may leave out.
inline constexpr char CTL_AUDIO_PREFIX[] = "AUDIO_CMD_";

// `audio CODE|NAME [ARG...]` and `audio list`, given the words after "audio";
// returns the exit status.
int CtlAudio(int argc, char** argv);

// Reports the outcome of one exchange with the audio daemon (a failure on
// standard error, success with -v); returns the exit status.
int CtlAudioOutcome(std::int32_t code, std::int32_t result);

// Ten band values from ten words. Otherwise false, with *bad at the first
// word that is not a finite number (nullptr when the count is wrong).
bool CtlParseBands(int count, char* const* words, float (&bands)[AUDIO_EQ_BANDS], const char** bad);

// Sends ten band values typed on the command line as the equalizer command;
// label names the command in messages. Returns the exit status.
int CtlSendBands(const char* label, int argc, char** argv);
