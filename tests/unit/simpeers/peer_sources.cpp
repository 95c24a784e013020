// The simulated peers live in tolk-sim; their sources are compiled into this test
// binary as they are, so the tests exercise exactly what tolk-sim runs.
#include "../../../sim/cit_audio_script.cpp"
#include "../../../sim/hostile.cpp"
#include "../../../sim/modem_script.cpp"
#include "../../../sim/modem_sim.cpp"
#include "../../../sim/radio_peer.cpp"
#include "../../../sim/sim_text.cpp"
#include "../../../sim/sim_util.cpp"
