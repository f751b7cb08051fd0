#include "analysis/TwinEvents.h"

#include "analysis/MessageNames.h"

namespace halvox::analysis {

bool isTwin(const TwinContent& first, const Record& next) {
  return next.service != kCommonService && next.type == first.type &&
         next.category == first.category && next.payload->json() == first.payload;
}

}  // namespace halvox::analysis
