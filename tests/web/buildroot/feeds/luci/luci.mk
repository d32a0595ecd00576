# Stands in for LuCI's own: what it makes of an application's folders, and the fields that the application names.
PKG_NAME?=$(notdir $(CURDIR))
include $(INCLUDE_DIR)/package.mk

define Package/$(PKG_NAME)
  DEPENDS:=$(LUCI_DEPENDS)
endef

define Package/$(PKG_NAME)/install
	$(INSTALL_DIR) $(1)/www
	$(CP) ./htdocs/* $(1)/www/
	$(CP) ./root/* $(1)/
endef

show-versions:
	@echo "$(PKG_VERSION) $(PKG_RELEASE) $(PKG_PO_VERSION)"

$(eval $(call BuildPackage,$(PKG_NAME)))
