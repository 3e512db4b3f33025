// The apply history table: records appended with the oldest dropped past a
// bound, in one transaction, and read back oldest first.
#include <hoxcm/config_store.h>

#include "platform/failpoint.h"
#include "platform/store/database.h"

namespace HoxConfigStore {

using detail::Database;

int64_t AppendApplyHistoryRow(const std::string& record, std::size_t keep) {
  int64_t sequence = 0;
  detail::CurrentDatabase(true)->Write("append to the apply history", [&](Database& db) {
    db.Prepare("INSERT INTO apply_history (record) VALUES (?)").Bind(1, record).Run();
    auto last = db.Prepare("SELECT max(seq) FROM apply_history");
    last.Step();
    sequence = last.Int(0);
    db.Prepare("DELETE FROM apply_history WHERE seq <= ?")
        .Bind(1, sequence - static_cast<int64_t>(keep == 0 ? 1 : keep))
        .Run();
    if (HoxPlatform::Failpoint("store.history")) detail::ThrowSqliteError(nullptr, SQLITE_IOERR, "append to the apply history");
  });
  return sequence;
}

std::vector<ApplyHistoryRow> GetApplyHistoryRows() {
  return detail::CurrentDatabase(true)->Read([](Database& db) {
    std::vector<ApplyHistoryRow> rows;
    auto select = db.Prepare("SELECT seq, record FROM apply_history ORDER BY seq");
    while (select.Step()) rows.push_back({select.Int(0), select.Text(1)});
    return rows;
  });
}

}  // namespace HoxConfigStore
