// Ctrl-C and SIGTERM end the current job in order instead of killing the process:
// the handler only raises a flag, and every loop of the host looks at it.
#pragma once

namespace korvo {
namespace host {

void installInterruptHandlers();  // SIGINT and SIGTERM raise the flag; SIGPIPE is ignored
bool interrupted();
int interruptSignal();  // the signal that raised the flag, 0 if none
// For a process driven by a parent that reports its ending: no line on an interruption.
void leaveInterruptionsToParent();
bool interruptionsLeftToParent();

}  // namespace host
}  // namespace korvo
