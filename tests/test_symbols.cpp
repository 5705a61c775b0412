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
    char buf[4096];
    for (size_t n; pipe && (n = fread(buf, 1, sizeof buf, pipe)) > 0;) out.append(buf, n);
    if (pipe) pclose(pipe);
    return out;
}

TEST(PluginSymbols, ExportsExactlyTheExternalInterfaceAndFindsThePlatformBesideIt) {
    const std::set<std::string> expected = {
        "soundMeter_maker", "soundMeter_destroy",                                    // factory, C linkage
        "_Z28AudioRecord_getMinBufferSizeiii", "_Z16recorderCallbackiPvS_",         // capture stream
        "_Z16read_write_audioPiiP11Mmic_data_t", "_Z20read_write_audio_intiPi", "_Z8readDonePsi",  // frame exchange
        "AudioBufferLock", "WaitAudioBuffer", "WF_Thread", "DataRW", "EventRW",
        "_Z16System_arraycopyN7android2spI16WaveTable_DoubleEEiS2_ii",               // real FFT
        "_ZN7android17MiniToneGenerator16sToneDescriptorsE",                          // tone code plan
    };
    // The toolchain's own symbols, and the address checker's markers beside exported globals.
    const std::set<std::string> toolchain = {"_init", "_fini", "_edata", "_end", "__bss_start"};
    std::set<std::string> actual;
    std::istringstream lines(run(KORVO_NM " -D --defined-only --format=posix '" KORVO_PLUGIN_PATH "'"));
    for (std::string line; std::getline(lines, line);) {
        const std::string name = line.substr(0, line.find(' '));
        if (!toolchain.count(name) && name.rfind("__odr_asan.", 0) != 0) actual.insert(name);
    }
    EXPECT_EQ(actual, expected);
    const std::string dynamic = run(KORVO_READELF " -d '" KORVO_PLUGIN_PATH "'");
    EXPECT_NE(dynamic.find("(RUNPATH)"), std::string::npos) << dynamic;
    EXPECT_NE(dynamic.find("[$ORIGIN]"), std::string::npos) << dynamic;
    EXPECT_NE(dynamic.find("libkorvo_platform.so"), std::string::npos) << dynamic;
}

TEST(PluginSymbols, TheToneTableIsExportedAs512RecordsOf216Bytes) {
    // A host reads the table through the symbol: its size is the layout hosts rely on.
    std::istringstream lines(run(KORVO_NM " -D -S --defined-only --format=posix '" KORVO_PLUGIN_PATH "'"));
    std::string size;
    for (std::string line; std::getline(lines, line);) {
        std::istringstream fields(line);
        std::string name, type, value;
        fields >> name >> type >> value;
        if (name == "_ZN7android17MiniToneGenerator16sToneDescriptorsE") fields >> size;
    }
    EXPECT_EQ(std::stoul(size.empty() ? "0" : size, nullptr, 16), 512u * 216u);
}

}  // namespace
