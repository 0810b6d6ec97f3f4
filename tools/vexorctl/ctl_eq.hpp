// vexorctl's equalizer commands: show and apply the default profile as the
// audio client resolves it (and say why there is none), or set ten bands.
#pragma once

// `eq show`, `eq set V1 ... V10` and `eq apply`, given the words after "eq";
// returns the exit status.
int CtlEq(int argc, char** argv);
