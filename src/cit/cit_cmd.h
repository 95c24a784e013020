// The factory CIT command family: local answers from the product-information flags
// and the result file, and the forwarding of the rest to the test application.
#ifndef TOLKD_CIT_CIT_CMD_H
#define TOLKD_CIT_CIT_CMD_H

#define CIT_SOCKET_NAME "auto_cit"
// The uid the test application runs under, set by the device build.
#define CIT_APP_UID_PROPERTY "ro.vendor.tolk.cit_uid"
#define CIT_RESULT_FILE "/data/prod/citf"
#define CIT_ANSWER_SIZE 1024

extern int sock_id;

int cit_test_check(const char *line);
int cit_test_pase(char *line);
// Sends word to the test application and receives its answer into answer (at
// least CIT_ANSWER_SIZE bytes). -1 without a link or buffer, else the answer length.
int cit_socket_write(const char *word, char *answer);

#endif
