// Hooks between the parts of the platform stand-in.
#pragma once

namespace korvo {
namespace platform {
namespace detail {

// Puts the output-track test controls back to their defaults (called by test::resetAll).
void resetTrackControl();

}  // namespace detail
}  // namespace platform
}  // namespace korvo
