// Plain entry points of the radio HAL bridge, for the rest of the daemon. The bridge
// sends each modem command as one HAL request and writes the HAL's answers and
// unsolicited output into its end of the modem socket pair.
#ifndef TOLKD_HAL_TOLKD_ADAPTATION_H
#define TOLKD_HAL_TOLKD_ADAPTATION_H

// Hands the bridge its end of a new modem socket pair.
void setSocketFdForAdaptation(int fd);
// Sends length bytes of data as one HAL request; true when the HAL accepted it.
bool sendRequest(const char *data, int length);
// Sends a command line with its NUL; answers "ERROR:No Modem" when it cannot.
int sendDataToRild(const char *line);
void sigpipe_handler(int sig);

#endif
