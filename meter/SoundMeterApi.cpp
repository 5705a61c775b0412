// The plug-in's entry points: the factory, the destroy function and the
// interface's own constructor and destructor.
#include <cstdio>

#include "interface/SoundMeter_vir.h"
#include "meter/SoundMeter.h"

SoundMeter_vir::SoundMeter_vir() { printf("Created"); }

SoundMeter_vir::~SoundMeter_vir() { printf("deleted"); }

extern "C" SoundMeter_vir* soundMeter_maker() { return new SoundMeter(); }

extern "C" void soundMeter_destroy(SoundMeter_vir* meter) {
    if (meter == nullptr) return;
    delete meter;  // deleting destructor: SoundMeter's, then SoundMeter_vir's ("deleted")
}
