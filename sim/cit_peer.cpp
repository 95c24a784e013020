// Placeholder until the cit peer exists: the process exits at once.
#include "peers.h"

int run_cit_peer(const std::string &, const std::vector<std::string> &) { return 0; }
