// All exported declarations of the lumo library, and the host's runtime
// services a caller needs with them: the exception types that fatal errors
// throw (nova::NumberedError, nova::DataException, ...) and the warning
// counter and sink (nova::GetWarningCount, nova::SetErrorSink). Headers are
// found in one include folder; host headers as "nova/<name>.h".
#pragma once

#include "lumo_ap.h"
#include "lumo_dispatch.h"
#include "lumo_ephemeris.h"
#include "lumo_gcp.h"
#include "lumo_lrs.h"
#include "lumo_mathmodel.h"
#include "lumo_poly.h"
#include "lumo_record_model.h"
#include "lumo_rf.h"
#include "lumo_rtcs.h"
#include "lumo_sensor.h"
#include "lumo_srit.h"
#include "lumo_tps.h"
#include "lumo_trn.h"
#include "lumo_types.h"
#include "nova/runtime.h"
