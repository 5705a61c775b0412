// Free functions of the capture stream.
#pragma once
#include "interface/Export.h"

// Minimum capture buffer in bytes for (rate, channel configuration, format), or -1.
KORVO_EXPORT int AudioRecord_getMinBufferSize(int sampleRate, int channelConfig, int audioFormat);
// Event callback of the capture stream: logs the event and nothing else.
KORVO_EXPORT void recorderCallback(int event, void* user, void* info);
