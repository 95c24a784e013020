// The routing half of the main loop: normalise each command line, parse it once,
// let the dispatcher run the local handlers and name the command type, and hand the
// line to whoever answers that type (modem, generic service, audio service, factory
// tests), with the host link that sent it, where its answer goes.
#include "core/reader.h"

#include <signal.h>
#include <string.h>

#include <cutils/properties.h>

#include "attok/at_tok.h"
#include "cit/cit_cmd.h"
#include "core/sms_merge.h"
#include "core/tolkd_log.h"
#include "dispatch/command_line.h"
#include "dispatch/dispatcher.h"
#include "hal/tolkd_adaptation.h"
#include "serial/response_writer.h"
#include "targets/generic_link.h"
#include "targets/mmi_queue.h"
#include "targets/modem_link.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

bool isMsgCmdInput = false;
unsigned msgTextPhase = 0;

// Read once per start; OP07 and OP12 change the daemon's behaviour.
static char operatorCode[PROPERTY_VALUE_MAX];

static const char kUserModeRefusal[] = "Not access to modem in User Mode.";

void readerLoopPreamble(void) {
    memset(operatorCode, 0, sizeof(operatorCode));
    // A host or service that goes away mid-write must not take the daemon with it.
    signal(SIGPIPE, sigpipe_handler);
    LOGD("Enter");
    property_get("persist.operator.optr", operatorCode, "OM");
    if (strcmp(operatorCode, "OP07") == 0) {
        LOGI("operator is OP07 and set PCT mode 0 for AT&T");
        property_set("persist.service.pct.mode", "0");
    } else {
        property_set("persist.service.pct.mode", "1");
    }
}

void endMsgTextPhase(void) {
    if (isMsgCmdInput || isNeedMergeMsgCmdInput) LOGD("SMS text input ends");
    isMsgCmdInput = false;
    isNeedMergeMsgCmdInput = false;
}

void msgTextPhaseEndedBy(unsigned phase) {
    if (phase == TEXT_PHASE_ANY || (phase != 0 && phase == msgTextPhase)) endMsgTextPhase();
}

void readerLoop(SerialDevice *dev) {
    readerLoopPreamble();
    for (;;) {
        char *line = readline(dev);
        routeCommandLine(dev, line);
    }
}

// "AT" alone, or followed by nothing but line-end characters: the liveness probe a
// production build lets through. On adb a line ends at CR, so an LF inside it is no
// end: "AT\n+CFUN=0" is a command and must not pass as a probe.
static bool isBareAt(const char *line) {
    if (strncmp(line, "AT", 2) != 0) return false;
    return line[2 + strspn(line + 2, "\r\n")] == '\0';
}

// On production builds the modem takes nothing but a bare "AT" unless the user-mode
// switch has been turned on.
static bool modemAccessAllowed(const char *line) {
    char buildType[PROPERTY_VALUE_MAX];
    char userMode[PROPERTY_VALUE_MAX];
    memset(buildType, 0, sizeof(buildType));
    memset(userMode, 0, sizeof(userMode));
    property_get("ro.build.type", buildType, "user");
    property_get("persist.service.tolk.usermode", userMode, "0");
    LOGI("Build type :%s, tolk_usermode:%s", buildType, userMode);
    if (strcmp(buildType, "eng") == 0 || strcmp(userMode, "1") == 0) return true;
    return isBareAt(line);
}

static void routeToModem(SerialDevice *dev, const CommandLine *cmd) {
    const char *line = cmd->text;
    if (!modemAccessAllowed(line)) {
        LOGI("%s", kUserModeRefusal);
        writeDataToSerial(kUserModeRefusal, (int)sizeof(kUserModeRefusal));
        // A refused AT+CPIN set form was already recorded by the dispatcher; it will
        // never be answered, so it must not lend its text to the next modem command.
        mmiCmdSeqCancelPending();
        return;
    }
    if (s_fdRild_command < 0) connectTarget(RIL_TYPE);

    unsigned phase = 0;
    if (isMsgCmd(line)) {
        LOGI("set isMsgCmd true");
        isMsgCmdInput = true;
        phase = ++msgTextPhase;
        msgCmdLfPending = true;
        if (strcmp(operatorCode, "OP12") == 0 && startMergeMsgCmdInputIfNeed(dev, line)) {
            // Held until its text is complete; the merged command goes out then.
            isNeedMergeMsgCmdInput = true;
            return;
        }
    }

    if (strncmp(line, "ATV1", 4) == 0) {
        LOGI("set Numeric flag false");
        gNumericMode = false;
    } else if (strncmp(line, "ATV0", 4) == 0) {
        LOGI("set Numeric flag true");
        gNumericMode = true;
    }
    // A command that never reached the modem gets no answer from it, so its text
    // phase would never end: the host's next lines would be taken as message text.
    if (sendToModem(line, &cmd->origin, phase) < 0 && phase != 0) endMsgTextPhase();
}

static void routeToGenericService(const CommandLine *cmd) {
    const char *line = cmd->text;
    if (s_fdService_command < 0) connectTarget(GENERIC_TYPE);
    if (s_fdService_command < 0 || sendDataToGenericService(line) < 0) {
        // No answer can come; a station must not wait for one until its timeout.
        writeDataToserialByResponseType(RESPONSE_ERROR);
        return;
    }
    if (strcmp(line, "AT+POWERKEY") == 0) {
        // The host expects the power key answer before anything else.
        LOGI("+POWERKEY COMMAND");
        serviceReaderLoop();
    } else {
        LOGI("Generic AT COMMAND");
        genericCommandSent(&cmd->origin);
    }
}

// Audio commands go out with the byte count as read, never more than the buffer
// still holds behind the (possibly trimmed) line.
static int audioLength(const SerialDevice *dev, const CommandLine *cmd) {
    const char *line = cmd->text;
    long room = (long)sizeof(dev->cmdBuf) - (line - dev->cmdBuf);
    if (line < dev->cmdBuf || room <= 0) return (int)strlen(line);
    return cmd->len < room ? cmd->len : (int)room;
}

static void routeToAudio(SerialDevice *dev, const CommandLine *cmd, int type) {
    LOGI("AUDIO COMMAND");
    if ((type == AUDIO_TYPE && s_fdAudio_command < 0) || (type == AUDIO_EXT_TYPE && s_fdAudioExt_command < 0)) {
        connectTarget(type);
    }
    sendDataToAudio(cmd->text, audioLength(dev, cmd), type);
    audioReaderLoop(type);
}

static void routeToBelvoAudio(SerialDevice *dev, const CommandLine *cmd) {
    const char *line = cmd->text;
    LOGI("BELVO AUDIO COMMAND");
    if (s_fdAudio_command < 0) connectTarget(BELVO_AUDIO_TYPE);
    // The MMI test settings must be in force before the command reaches the test
    // tool, and stay until the disable command's own answer has gone out.
    bool enable = strncmp(line, "AT^MMITESTENABLE=1", 18) == 0 || strncmp(line, "at^mmitestenable=1", 18) == 0;
    bool disable = strncmp(line, "AT^MMITESTENABLE=0", 18) == 0 || strncmp(line, "at^mmitestenable=0", 18) == 0;
    if (enable) setMMITESTOption(1);
    sendDataToAudio(line, audioLength(dev, cmd), BELVO_AUDIO_TYPE);
    audioReaderLoop(BELVO_AUDIO_TYPE);
    if (disable) setMMITESTOption(0);
}

void routeCommandLine(SerialDevice *dev, char *line) {
    LOGI("Command:[%s]", line != NULL ? line : "(null)");
    if (line == NULL) return;
    // The reader made the line's link the current one.
    const HostLink origin = currentHostLink();

    if (isMsgCmdInput) {
        routeMsgTextLine(dev, &origin);
        return;
    }

    // Device-maker audio commands reach their tool exactly as typed.
    if (!lineKeptAsTyped) {
        convertToUpperCase(line, '=');
        trim_string(&line);
    }

    LOGI("Command:%s", line);
    CommandLine cmd;
    parseCommandLine(&cmd, line, dev->cmdLen, &origin);
    int type = dispatchCommandLine(&cmd);
    LOGI("The command type is belonged to :%d", type);

    switch (type) {
    case RIL_TYPE:
        routeToModem(dev, &cmd);
        break;
    case AUDIO_TYPE:
    case AUDIO_EXT_TYPE:
        routeToAudio(dev, &cmd, type);
        break;
    case TOLK_TYPE:
        LOGI("TOLK COMMAND");
        break;
    case GENERIC_TYPE:
        routeToGenericService(&cmd);
        break;
    case BELVO_AUDIO_TYPE:
        routeToBelvoAudio(dev, &cmd);
        break;
    case BELVO_AUTIOCIT_TYPE:
        LOGI("BELVO_AUTIOCIT_TYPE");
        cit_test_pase(line);
        break;
    case BAT_TYPE:
    default:
        // Already answered by the dispatcher, or nobody to route to.
        break;
    }
}
