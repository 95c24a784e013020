// Placeholder until the generic peer exists: the process exits at once.
#include "peers.h"

int run_generic_peer(const std::string &, const std::vector<std::string> &) { return 0; }
