#pragma once

namespace appsync {

/// Does nothing: whoever calls it links every file of suites, and with it the suites' tests.
void linkContractSuites();

}  // namespace appsync
