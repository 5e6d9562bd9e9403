#include "axd/AXDPlugInSignature.h"

#include "platform/os/Digest.h"
#include "platform/value/Uuid.h"

AXDPlugInSignature::AXDPlugInSignature(const AXFileURL&) : requirement_("dummy requirement") {
  std::string text = value::Uuid::random().string();
  cdhash_ = os::Digest::sha1(text);
}
