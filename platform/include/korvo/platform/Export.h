// Symbols of the platform stand-in are always public: consumers link against them.
#pragma once
#define KORVO_PLATFORM_API __attribute__((visibility("default")))
