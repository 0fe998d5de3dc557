#include "platform/linux/LinuxDiagnosticCapture.h"

namespace tamblo {

void LinuxDiagnosticCapture::captureStacks(StackCaptureRequest) {}

} // namespace tamblo
