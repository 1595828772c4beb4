// The client of a Keymaster device, whole: sessions and operations with the Keymaster, its numbers
// and their names, SOTER, and the device's other applications.
#pragma once

#include "keymaster/client/authenticator.h"
#include "keymaster/client/bytes.h"
#include "keymaster/client/connection.h"
#include "keymaster/client/names.h"
#include "keymaster/client/operation.h"
#include "keymaster/client/param_set.h"
#include "keymaster/client/session.h"
#include "keymaster/client/soter.h"
#include "keymaster/client/status.h"
#include "keymaster/client/vault.h"
#include "keymaster/tags.h"
#include "keymaster/uuids.h"
