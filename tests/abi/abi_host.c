/* A host written in C: it loads the plug-in by path, gets the factory with
 * dlsym and calls the operations by their position in the virtual table,
 * without the project's C++ header. Each check proves, through a result or a
 * log line, that a position reaches the operation it should. */
#define _GNU_SOURCE
#include <dlfcn.h>
#include <fcntl.h>
#include <stdbool.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

typedef void* Meter;
typedef Meter (*maker_t)(void);
typedef void (*destroy_t)(Meter);

/* Operation k (1..32) sits after the two destructor entries. */
static void* slot(Meter m, int k) { return (*(void***)m)[k + 1]; }

typedef void (*v_v)(Meter);
typedef void (*v_i)(Meter, int);
typedef void (*v_b)(Meter, bool);
typedef void (*v_ii)(Meter, int, int);
typedef int (*i_v)(Meter);
typedef int (*i_i)(Meter, int);
typedef int (*i_p)(Meter, char*);
typedef int (*i_f)(Meter, float*);
typedef bool (*b_v)(Meter);
typedef float (*f_fip)(Meter, float*, int, int*);
typedef void (*v_ffpp)(Meter, float, float*, int*, int*);
typedef void (*v_ppp)(Meter, int*, int*, int*);

enum {
    MAKE_TONE = 1, RELEASE_TONE, PROCESS_AUDIO, SET_ACTIVE, SET_NEED_ACK, SET_ROLE, GET_ROLE, STOP_AUDIO,
    SAY_ALL, SAY_IDX, SAY_STRING, HEAR_RESPONSE, HEAR_IDX, GET_COUNT, GET_LEVEL, SET_LEVEL, SPECTRUM,
    SPECTRUM_ZORV, PEAK, PEAK_ZORV, SECOND_PEAK_ZORV, TWO_PEAK, TWO_PEAK_ZORV, TWO_PEAK_FRAME, START_WF,
    END_WF, RECORD_STATE, START_RECORD, STOP_RECORD, WF_STATE, STOP_TONE, SET_SPEAKER_STATE
};

static int failures = 0;
static char logPath[256];
static char outPath[256];

#define CHECK(cond, what) \
    ((cond) ? (void)0 : (void)(fprintf(stderr, "FAILED: %s (line %d)\n", what, __LINE__), failures++))

static char* slurp(const char* path) {
    FILE* f = fopen(path, "rb");
    if (!f) return strdup("");
    fseek(f, 0, SEEK_END);
    long n = ftell(f);
    fseek(f, 0, SEEK_SET);
    char* buf = malloc((size_t)n + 1);
    size_t got = fread(buf, 1, (size_t)n, f);
    buf[got] = 0;
    fclose(f);
    return buf;
}

static long fileSize(const char* path) {
    struct stat st;
    return stat(path, &st) == 0 ? (long)st.st_size : 0;
}

/* Whether `text` appears in the file after byte offset `since`. */
static bool hasSince(const char* path, long since, const char* text) {
    fflush(stdout);
    char* all = slurp(path);
    bool found = (long)strlen(all) >= since && strstr(all + since, text) != NULL;
    free(all);
    return found;
}

static void clearSpectrum(float* s) { memset(s, 0, 256 * sizeof(float)); }

int main(int argc, char** argv) {
    if (argc < 2) {
        fprintf(stderr, "usage: abi_host PLUGIN.so\n");
        return 2;
    }
    snprintf(logPath, sizeof logPath, "/tmp/korvo-abi-log-%d.txt", (int)getpid());
    snprintf(outPath, sizeof outPath, "/tmp/korvo-abi-out-%d.txt", (int)getpid());
    unlink(logPath);
    setenv("KORVO_LOG", logPath, 1);
    setenv("KORVO_LOG_LEVEL", "V", 1);
    setenv("KORVO_MIC", "null", 1);
    setenv("KORVO_SPEAKER", "null", 1);
    /* The library's own standard-output lines go to a file we can read back. */
    fflush(stdout);
    int outFd = open(outPath, O_CREAT | O_TRUNC | O_WRONLY, 0600);
    int savedOut = dup(1);
    dup2(outFd, 1);

    void* lib = dlopen(argv[1], RTLD_NOW | RTLD_LOCAL);
    if (!lib) {
        fprintf(stderr, "dlopen: %s\n", dlerror());
        return 1;
    }
    maker_t maker = (maker_t)dlsym(lib, "soundMeter_maker");
    destroy_t destroy = (destroy_t)dlsym(lib, "soundMeter_destroy");
    CHECK(maker && destroy, "factory symbols");
    if (!maker || !destroy) return 1;

    destroy(NULL); /* does nothing */
    CHECK(fileSize(outPath) == 0, "soundMeter_destroy(NULL) writes nothing");

    long out0 = fileSize(outPath);
    Meter m = maker();
    CHECK(m != NULL, "maker result");
    CHECK(hasSince(outPath, out0, "Created"), "\"Created\" on standard output");
    CHECK(hasSince(logPath, 0, "D/TQX: [SoundMeter] SoundMeter start!"), "constructor log");

    /* 6, 7: role */
    ((v_i)slot(m, SET_ROLE))(m, 7);
    CHECK(((i_v)slot(m, GET_ROLE))(m) == 7, "setRole/getRole");

    /* 11: SayString */
    CHECK(((i_p)slot(m, SAY_STRING))(m, "hello") == 0, "SayString returns 0");

    /* 19..24: detectors and vote, on arrays with known answers */
    float s[256];
    int a = -1, b = -1;
    clearSpectrum(s);
    s[0] = 60.0f;
    s[1] = 50.0f;
    float p = ((f_fip)slot(m, PEAK))(m, s, 0, &a);
    CHECK(a == 1 && p == 50.0f, "detectPeakFreq compares entry 1 with 0.0");
    a = -1;
    p = ((f_fip)slot(m, PEAK_ZORV))(m, s, 0, &a);
    CHECK(a == 0 && p == 0.0f, "detectPeakFreq_zorv compares entry 1 with entry 0");

    clearSpectrum(s);
    s[30] = 50.0f;
    s[60] = 10.0f;
    s[80] = 40.0f;
    a = -1;
    p = ((f_fip)slot(m, SECOND_PEAK_ZORV))(m, s, 30, &a);
    CHECK(a == 60 && p == 10.0f, "detectSecondPeakFreq_zorv reports the displaced maximum");
    a = -1, b = -1;
    ((v_ffpp)slot(m, TWO_PEAK_ZORV))(m, 0.9f, s, &a, &b);
    CHECK(a == 30 && b == 60, "detectTwoPeakFreq_zorv");

    clearSpectrum(s);
    s[150] = 50.0f;
    s[50] = 20.0f;
    s[0] = 10.0f;
    a = -1, b = -1;
    long log0 = fileSize(logPath);
    ((v_ffpp)slot(m, TWO_PEAK))(m, 0.9f, s, &a, &b);
    CHECK(a == 50 && b == 150, "detectTwoPeakFreq");
    CHECK(hasSince(logPath, log0, "Two Max Power is 50(50.000000) and 150(20.000000) END"), "two-peak log line");

    int frames[14];
    for (int i = 0; i < 7; i++) {
        frames[i] = 30;
        frames[7 + i] = 120;
    }
    a = -1, b = -1;
    ((v_ppp)slot(m, TWO_PEAK_FRAME))(m, frames, &a, &b);
    CHECK(a == 30 && b == 120, "detectTwoPeakFrame");

    /* 25, 30: analysis thread; 15, 16: detection level; 4: setActive */
    CHECK(((b_v)slot(m, WF_STATE))(m) == false, "no analysis thread yet");
    log0 = fileSize(logPath);
    ((v_v)slot(m, START_WF))(m);
    CHECK(hasSince(logPath, log0, "[SoundMeter] start_wf_thread"), "start_wf_thread log");
    CHECK(((b_v)slot(m, WF_STATE))(m) == true, "analysis thread exists");
    log0 = fileSize(logPath);
    ((v_i)slot(m, SET_LEVEL))(m, -5);
    CHECK(hasSince(logPath, log0, "E/TQX: [WAVEFORM_CANVAS] detection Level is -5"), "setDetectionLevel log");
    CHECK(((i_v)slot(m, GET_LEVEL))(m) == -5, "getDetectionLevel");
    ((v_i)slot(m, SET_LEVEL))(m, 0);
    log0 = fileSize(logPath);
    ((v_b)slot(m, SET_ACTIVE))(m, true);
    CHECK(((i_v)slot(m, GET_LEVEL))(m) == 0 && fileSize(logPath) == log0, "setActive changes nothing visible");

    /* 17, 18: the read-outs differ in which entries they write */
    for (int i = 0; i < 256; i++) s[i] = 7.0f;
    int n = ((i_f)slot(m, SPECTRUM))(m, s);
    CHECK(n == 0 && s[0] == 7.0f && s[1] == 0.0f && s[255] == 0.0f, "getSpectrumData on silence");
    for (int i = 0; i < 256; i++) s[i] = 7.0f;
    n = ((i_f)slot(m, SPECTRUM_ZORV))(m, s);
    CHECK(n == 0 && s[0] == 7.0f && s[1] == 7.0f && s[2] == 0.0f, "getSpectrumData_zorv on silence");

    /* 27, 28, 3, 8, 29: capture */
    CHECK(((i_v)slot(m, RECORD_STATE))(m) == 0, "not recording");
    ((v_v)slot(m, PROCESS_AUDIO))(m); /* no stream yet: nothing happens */
    log0 = fileSize(logPath);
    ((v_v)slot(m, START_RECORD))(m);
    CHECK(hasSince(logPath, log0, "[SoundMeter] AudioRecord preparation 50"), "startRecord preparation lines");
    CHECK(((i_v)slot(m, RECORD_STATE))(m) == 1, "recording");
    typedef int (*rw_t)(int*, int, void*);
    rw_t rw = (rw_t)dlsym(lib, "_Z16read_write_audioPiiP11Mmic_data_t");
    CHECK(rw != NULL, "read_write_audio exported");
    struct {
        int32_t index;
        float level;
        int16_t data[2560];
        int32_t count;
        int32_t reserved;
    } record;
    for (int step = 0; step < 2; step++) ((v_v)slot(m, PROCESS_AUDIO))(m);
    if (rw) {
        int unused = 0;
        rw(&unused, 0, &record);
        CHECK(record.index == 1 && record.count == 512, "processAudio published two whole frames");
    }
    ((v_v)slot(m, STOP_AUDIO))(m);
    CHECK(((i_v)slot(m, RECORD_STATE))(m) == 1, "stopAudio keeps the recording state");

    /* 12, 13, 14: hearing steps count */
    int before = ((i_v)slot(m, GET_COUNT))(m);
    CHECK(((i_v)slot(m, HEAR_RESPONSE))(m) == -1, "HearAndResponse returns -1");
    CHECK(((i_i)slot(m, HEAR_IDX))(m, 5) == -1, "HearFreqIdx of a tone never said");
    CHECK(((i_v)slot(m, GET_COUNT))(m) == before + 2, "getCount counts hearing steps");

    log0 = fileSize(logPath);
    ((v_v)slot(m, STOP_RECORD))(m);
    CHECK(hasSince(logPath, log0, "[SoundMeter] AudioRecord Stopped"), "stopRecord log");
    CHECK(((i_v)slot(m, RECORD_STATE))(m) == 0, "stopRecord clears the state");

    /* 1, 2, 5, 9, 10, 31, 32: tones and the handshake */
    log0 = fileSize(logPath);
    ((v_i)slot(m, MAKE_TONE))(m, 3);
    CHECK(hasSince(logPath, log0, "[SoundMeter] makeToneGenerator"), "makeToneGenerator log");
    CHECK(hasSince(logPath, log0, "MiniToneGenerator constructor: streamType=3, volume=0.800000"),
          "tone generator constructed");
    ((v_i)slot(m, SET_ROLE))(m, 2);
    ((v_b)slot(m, SET_NEED_ACK))(m, true);
    log0 = fileSize(logPath);
    ((v_ii)slot(m, SAY_IDX))(m, 1, 40);
    CHECK(hasSince(logPath, log0, "[SoundMeter][virtual void SoundMeter::SayFreqIdx(int, int)][START]"),
          "SayFreqIdx start line");
    CHECK(hasSince(logPath, log0, "[END] speaker_state = 1, listener_state = 0"),
          "setNeedAck(true) leaves the speaker waiting for its acknowledgement");
    log0 = fileSize(logPath);
    ((v_i)slot(m, SET_SPEAKER_STATE))(m, 0);
    CHECK(hasSince(logPath, log0, "[SoundMeter] set speaker state: 0"), "setSpeakerState log");
    ((v_b)slot(m, SET_NEED_ACK))(m, false);
    long outBefore = fileSize(outPath);
    ((v_i)slot(m, SAY_ALL))(m, 40);
    CHECK(hasSince(outPath, outBefore, "CNT TIME TONE PLAYING[0:30000]"), "SayAllFreqIndex says tone 0");
    log0 = fileSize(logPath);
    ((v_v)slot(m, STOP_TONE))(m);
    CHECK(hasSince(logPath, log0, "E/MiniToneGenerator: stopTone"), "stopFreqTone reaches stopTone");
    log0 = fileSize(logPath);
    ((v_v)slot(m, RELEASE_TONE))(m);
    CHECK(hasSince(logPath, log0, "[SoundMeter] releaseToneGenerator"), "releaseToneGenerator log");
    CHECK(hasSince(logPath, log0, "MiniToneGenerator destructor"), "tone generator deleted");

    /* 26: end the thread; then destroy */
    log0 = fileSize(logPath);
    ((v_v)slot(m, END_WF))(m);
    CHECK(hasSince(logPath, log0, "[SoundMeter] WF_Thread threadLoop finished"), "end_wf_thread");
    CHECK(((b_v)slot(m, WF_STATE))(m) == false, "no analysis thread after end_wf_thread");

    outBefore = fileSize(outPath);
    destroy(m);
    CHECK(hasSince(outPath, outBefore, "deleted"), "\"deleted\" on standard output");

    dlclose(lib);
    fflush(stdout);
    dup2(savedOut, 1);
    close(outFd);
    if (failures == 0) {
        unlink(logPath);
        unlink(outPath);
        printf("abi_host: every operation reached by its position\n");
        return 0;
    }
    fprintf(stderr, "abi_host: %d failures (log kept in %s, output in %s)\n", failures, logPath, outPath);
    return 1;
}
