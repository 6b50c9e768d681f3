#include "evaluation/PipelineSetting.h"

#include "recording/JsonValue.h"

namespace VeltoTouch {

VeltoHost::PropertyValue PipelineSetting::propertyValue() const
{
    return JsonValue::parse(value.dump(), JsonValue::TopLevel::AnyValue);
}

std::string PipelineSetting::text() const { return key + "=" + value.dump(); }

}  // namespace VeltoTouch
