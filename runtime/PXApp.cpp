// The single application object.
#include "runtime/PXApp.h"

PXApp& PXApp::Instance() {
  static PXApp app;
  return app;
}
