// Placeholder bodies so the daemon links while the subsystem is being written.
#include "hal/tolkd_adaptation.h"
void setSocketFdForAdaptation(int) {}
bool sendRequest(const char *, int) { return false; }
int sendDataToRild(const char *) { return 0; }
void sigpipe_handler(int) {}
