// Filling apply history records (operations.h) from what an operation
// computed, and appending them with a bound of the caller's choosing.
// Apply records itself; boot-time apply and the host API's changes build
// their records with the same pieces: the verdict, the runs, the outcome.
//
// Thread safety: the functions touch only their arguments and the store,
// whose connection serialises its own use.
#pragma once

#include <cstddef>
#include <cstdint>
#include <exception>
#include <functional>
#include <string>
#include <vector>

#include <hoxcm/operations.h>

#include "workflow/remediation.h"

namespace HoxConfigManager {

// The verdict an operation went by: statements and reasons, each list cut
// at kApplyHistoryListLimit, each reason's values at 256 bytes.
void RecordVerdict(ApplyHistoryRecord& record, const ImpactResult& impact, const ImpactReasons& reasons);
// The runs of a remediation.
std::vector<ApplyHistoryRun> HistoryRuns(const std::vector<GroupRun>& runs);
// The outcome of an operation that returned `result` ("nothing to do" when
// the host already complied: `compliant`).
void RecordResult(ApplyHistoryRecord& record, const ApplyResult& result, bool compliant);
// The outcome of an operation that threw `error`: "refused" for 2024, 2025,
// 2026 and 2029, "error" otherwise.
void RecordException(ApplyHistoryRecord& record, const std::exception_ptr& error);

// Runs `operation` and appends `record` to the history whatever happens:
// `kind`, the start and the wall time, then the outcome of the result it
// returns (`nothingToDo` set by it: "nothing to do") or of the exception it
// throws, which goes on to the caller. The operation fills in the rest.
ApplyResult RecordOperation(const char* kind, ApplyHistoryRecord& record,
                            const std::function<ApplyResult(bool& nothingToDo)>& operation);

// AppendApplyHistory keeping the `keep` newest records.
int64_t AppendApplyHistory(const ApplyHistoryRecord& record, std::size_t keep);
// Appends `record`, logging instead of throwing when the store refuses: the
// operation it records has already happened and its result must not change.
void AppendApplyHistoryOrLog(const ApplyHistoryRecord& record);

}  // namespace HoxConfigManager
