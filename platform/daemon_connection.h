#pragma once

#include "system/daemon_connection.h"
