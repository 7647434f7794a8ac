#pragma once

#include <memory>
#include <utility>

#include "testing/FaultScript.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {

// Decodes as the decoder within and gives an error beside the result when a script's point
// "decoder" says so. As the one within otherwise; the script outlives it.
class FaultyDecoder final : public KXSTransportDecoder {
 public:
  FaultyDecoder(std::shared_ptr<KXSTransportDecoder> inner, FaultScript& script)
      : inner_(std::move(inner)), script_(script) {}

  KXSLibraryChangeSnapshotPtr decodeSnapshotFromPropertyList(const Value& root,
                                                             ErrorPtr* error) override {
    if (const auto fault = script_.take("decoder")) {
      setError(error, fault->error ? fault->error : injectedError("decoder"));
      return KXSLibraryChangeSnapshot::librarySnapshot();
    }
    return inner_->decodeSnapshotFromPropertyList(root, error);
  }

 private:
  std::shared_ptr<KXSTransportDecoder> inner_;
  FaultScript& script_;
};

}  // namespace kx
