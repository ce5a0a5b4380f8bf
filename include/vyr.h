/*
 * libvyr: labels of a mandatory access control system.
 *
 * This header brings in the whole public interface. Programs may also include
 * the headers of the families they use from <vyr/...>.
 */
#ifndef VYR_H
#define VYR_H

#include <vyr/common.h>
#include <vyr/types.h>
#include <vyr/label.h>
#include <vyr/kernel.h>
#include <vyr/raw.h>
#include <vyr/text.h>
#include <vyr/session.h>
#include <vyr/namedb.h>
#include <vyr/classic.h>

#endif /* VYR_H */
