// The plug-in is built with hidden visibility; only what is marked here is exported.
#pragma once
#define KORVO_EXPORT __attribute__((visibility("default")))
