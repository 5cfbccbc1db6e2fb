#include "platform/error.h"

namespace vemo {

namespace {

class ErrorCategory : public std::error_category {
 public:
  const char* name() const noexcept override { return "vemo"; }

  std::string message(int code) const override {
    switch (static_cast<ErrorCode>(code)) {
      case ErrorCode::kBadUse: return "bad use";
      case ErrorCode::kBadInput: return "bad input";
      case ErrorCode::kMalformedBytes: return "malformed bytes";
      case ErrorCode::kStoreFailed: return "the store failed";
      case ErrorCode::kSpaceNotFound: return "space not found";
      case ErrorCode::kSpaceBusy: return "space busy";
      case ErrorCode::kIncompatibleSpace: return "incompatible space";
      case ErrorCode::kStaleGeneration: return "stale generation";
      case ErrorCode::kPoisonedTransaction: return "poisoned transaction";
      case ErrorCode::kCorruptRecord: return "corrupt record";
      case ErrorCode::kDanglingReference: return "dangling reference";
      case ErrorCode::kSnapshotExpired: return "snapshot expired";
      case ErrorCode::kUnknownOutcome: return "unknown outcome";
    }
    return "unknown error";
  }

  std::error_condition default_error_condition(int code) const noexcept override {
    switch (static_cast<ErrorCode>(code)) {
      case ErrorCode::kBadUse:
      case ErrorCode::kBadInput:
      case ErrorCode::kMalformedBytes:
      case ErrorCode::kSpaceNotFound:
      case ErrorCode::kIncompatibleSpace: return make_error_condition(Remedy::kCorrectTheCall);
      case ErrorCode::kSpaceBusy:
      case ErrorCode::kSnapshotExpired: return make_error_condition(Remedy::kRetry);
      case ErrorCode::kStaleGeneration:
      case ErrorCode::kPoisonedTransaction:
      case ErrorCode::kUnknownOutcome: return make_error_condition(Remedy::kAbandonTransaction);
      case ErrorCode::kStoreFailed: return make_error_condition(Remedy::kCloseSpace);
      case ErrorCode::kCorruptRecord:
      case ErrorCode::kDanglingReference: return make_error_condition(Remedy::kRestoreData);
    }
    return std::error_category::default_error_condition(code);
  }
};

class RemedyCategory : public std::error_category {
 public:
  const char* name() const noexcept override { return "vemo remedy"; }

  std::string message(int remedy) const override {
    switch (static_cast<Remedy>(remedy)) {
      case Remedy::kCorrectTheCall: return "correct the call or its input";
      case Remedy::kRetry: return "try again";
      case Remedy::kAbandonTransaction: return "abandon the transaction and begin again";
      case Remedy::kCloseSpace: return "close the space, see to the machine, open it again";
      case Remedy::kRestoreData: return "restore the data";
    }
    return "unknown remedy";
  }
};

}  // namespace

const std::error_category& VemoErrorCategory() noexcept {
  static const ErrorCategory category;
  return category;
}

const std::error_category& VemoRemedyCategory() noexcept {
  static const RemedyCategory category;
  return category;
}

std::error_code make_error_code(ErrorCode code) noexcept { return {static_cast<int>(code), VemoErrorCategory()}; }

std::error_condition make_error_condition(Remedy remedy) noexcept {
  return {static_cast<int>(remedy), VemoRemedyCategory()};
}

}  // namespace vemo
