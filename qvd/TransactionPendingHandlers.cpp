// Requests whose handlers have not landed yet. Each is refused exactly as an
// unknown request name is, so a client cannot tell a request the daemon does
// not serve yet from one it will never serve. Each handler moves to the file
// of its request family when it lands.
#include "Quorvex/QVErrors.h"
#include "qvd/Transaction.h"

namespace qvd {

void Transaction::notYetServed() { failMessage(QVErrorInvalidRequest, "unrecognized request"); }

void Transaction::addPlugIns() { notYetServed(); }
void Transaction::removePlugIns() { notYetServed(); }
void Transaction::bulkPlugIns() { notYetServed(); }
void Transaction::readyPlugIns() { notYetServed(); }
void Transaction::accessPlugIns() { notYetServed(); }

}  // namespace qvd
