#include "platform/x11/IndicatorModule.h"

#include "platform/x11/PangoIndicatorPainter.h"

using namespace qv::platform;

QV_MODULE_DEFINE_ABI;

QV_MODULE_EXPORT void qvMakeIndicatorPainter(std::unique_ptr<IndicatorPainter>& painter) {
  painter = std::make_unique<PangoIndicatorPainter>();
}
