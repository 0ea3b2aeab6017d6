#include "geombind/algorithm/bind_strategy.h"

namespace TessikSDK::GeomBind::Algorithm {

IBindOptions::~IBindOptions() = default;

IBindStrategy::~IBindStrategy() = default;

}  // namespace TessikSDK::GeomBind::Algorithm
