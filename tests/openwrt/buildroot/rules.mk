# The few names of OpenWrt's buildroot that a package Makefile uses before it includes anything else.
INCLUDE_DIR:=$(TOPDIR)/include
STAGE?=$(TOPDIR)/stage
PKG_BUILD_DIR=$(STAGE)/build
PKG_INSTALL_DIR=$(STAGE)/install
INSTALL_DIR:=install -d -m0755
INSTALL_BIN:=install -m0755
INSTALL_DATA:=install -m0644
INSTALL_CONF:=install -m0600
CP:=cp -fpR
HOST_TAR:=tar
TARGET_CROSS:=
qstrip=$(strip $(subst ",,$(1)))
