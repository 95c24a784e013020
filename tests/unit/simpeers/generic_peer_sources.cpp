// Kept apart from the radio peer's sources: both have file-local helpers of the
// same names.
#include "../../../sim/generic_peer.cpp"
