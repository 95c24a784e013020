// The command types the dispatcher gives a line. For the forwarding types the value
// also names the target link that carries the command, so the target links use
// these values without depending on the dispatcher.
#ifndef TOLKD_DISPATCH_COMMAND_TYPE_H
#define TOLKD_DISPATCH_COMMAND_TYPE_H

#define RIL_TYPE 1
#define AUDIO_TYPE 2
#define TOLK_TYPE 4
#define GENERIC_TYPE 5
#define BAT_TYPE 6
#define AUDIO_EXT_TYPE 7
#define BELVO_AUDIO_TYPE 9
#define BELVO_AUTIOCIT_TYPE 10

#endif
