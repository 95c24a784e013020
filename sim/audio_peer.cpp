// Placeholder until the audio peer exists: the process exits at once.
#include "peers.h"

int run_audio_peer(const std::string &, const std::vector<std::string> &) { return 0; }
