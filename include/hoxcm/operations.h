// Host operations: the workflow built on extraction, the drift engine and the
// plugin framework, as the host's daemons, boot scripts and tools call it.
// docs/architecture.md lists what lands here (validation, impact,
// check-apply and apply, boot-time apply, the single-item host API) and in
// which layer each piece lives.
//
// Every operation runs on the caller's thread.
#pragma once

#include <hoxcm/drift.h>
#include <hoxcm/extraction.h>
#include <hoxcm/plugins.h>
