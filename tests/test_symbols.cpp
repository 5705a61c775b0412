// The plug-in's dynamic symbol table holds exactly the library's external
// interface, and it finds the platform stand-in beside itself.
#include <gtest/gtest.h>

#include <cstdio>
#include <set>
#include <sstream>
#include <string>

namespace {

std::string run(const std::string& command) {
    std::string out;
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) return out;
    char buf[4096];
    size_t n;
    while ((n = fread(buf, 1, sizeof buf, pipe)) > 0) out.append(buf, n);
    pclose(pipe);
    return out;
}

std::set<std::string> definedDynamicSymbols(const std::string& path) {
    std::set<std::string> names;
    std::istringstream lines(run("nm -D --defined-only --format=posix '" + path + "'"));
    std::string line;
    while (std::getline(lines, line)) {
        std::istringstream fields(line);
        std::string name;
        if (fields >> name) names.insert(name);
    }
    return names;
}

}  // namespace

TEST(PluginSymbols, ExportsExactlyTheExternalInterface) {
    const std::set<std::string> expected = {
        // factory and destroy function, C linkage
        "soundMeter_maker",
        "soundMeter_destroy",
        // capture stream
        "_Z28AudioRecord_getMinBufferSizeiii",
        "_Z16recorderCallbackiPvS_",
        // frame exchange
        "_Z16read_write_audioPiiP11Mmic_data_t",
        "_Z20read_write_audio_intiPi",
        "_Z8readDonePsi",
        "AudioBufferLock",
        "WaitAudioBuffer",
        "WF_Thread",
        "DataRW",
        "EventRW",
        // real FFT
        "_Z16System_arraycopyN7android2spI16WaveTable_DoubleEEiS2_ii",
        // tone code plan
        "_ZN7android17MiniToneGenerator16sToneDescriptorsE",
    };
    // Symbols the toolchain itself may put in any shared object's table.
    const std::set<std::string> toolchain = {"_init", "_fini", "_edata", "_end", "__bss_start"};

    const std::set<std::string> actual = definedDynamicSymbols(KORVO_PLUGIN_PATH);
    ASSERT_FALSE(actual.empty()) << "nm found no symbols in " << KORVO_PLUGIN_PATH;
    for (const auto& name : expected) {
        EXPECT_TRUE(actual.count(name)) << "missing export: " << name;
    }
    for (const auto& name : actual) {
        // AddressSanitizer adds one-definition-rule markers beside exported globals.
        if (name.rfind("__odr_asan.", 0) == 0) continue;
        EXPECT_TRUE(expected.count(name) || toolchain.count(name)) << "unexpected export: " << name;
    }
}

TEST(PluginSymbols, FindsThePlatformStandInThroughItsRunpath) {
    const std::string dynamic = run("readelf -d '" + std::string(KORVO_PLUGIN_PATH) + "'");
    EXPECT_NE(dynamic.find("(RUNPATH)"), std::string::npos) << dynamic;
    EXPECT_NE(dynamic.find("[$ORIGIN]"), std::string::npos) << dynamic;
    EXPECT_NE(dynamic.find("libkorvo_platform.so"), std::string::npos) << dynamic;
}
