// The peers of the simulated device outside the daemon. tolk-sim runs each one as a
// child process ("tolk-sim peer NAME --root DIR [ARGS]"); each peer lives in its own
// file and its entry point returns the process exit status.
#ifndef TOLK_SIM_PEERS_H
#define TOLK_SIM_PEERS_H

#include <string>
#include <vector>

// Radio HAL service serving "slot1".."slot4" (radio_peer.cpp).
int run_radio_peer(const std::string &root, const std::vector<std::string> &args);
// `tolk-sim urc --root DIR [--slot N] TEXT`: unsolicited output from a slot.
int send_radio_urc(const std::string &root, int slot, const std::string &text);
// Generic framework service on "tolk-service" (generic_peer.cpp).
int run_generic_peer(const std::string &root, const std::vector<std::string> &args);
// Audio services on "tolk-audio" and "rild-tolk-md2" (audio_peer.cpp).
int run_audio_peer(const std::string &root, const std::vector<std::string> &args);
// CIT test application on the abstract socket "auto_cit" (cit_peer.cpp).
int run_cit_peer(const std::string &root, const std::vector<std::string> &args);

#endif
