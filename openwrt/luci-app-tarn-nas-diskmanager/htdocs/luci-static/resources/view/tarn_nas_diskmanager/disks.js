'use strict';
'require view';
'require dom';
'require poll';
'require rpc';
'require ui';
'require tarn_nas_diskmanager.texts as texts';

/*
 * The disks of the disk manager. What it shows was written by whoever formatted a disk: all of it goes into the page as
 * a child in an array, which E() takes for text, and never as a bare string, which it takes for HTML.
 */

var POLL_SECONDS = 5;
/* How often, and for how long, a removal is looked after. */
var LOOK_SECONDS = 1;
var GIVE_UP_SECONDS = 60;
/* The daemon tries for about 10 s and then lets go. It is asked again, but not while it may still be at it. */
var ASK_AGAIN_SECONDS = 15;
/* A disk that was plugged in while the page was open is given so long to be mounted. */
var SETTLE_SECONDS = 30;
/* What may be told of a disk on its way in or out. */
var SETTLING = [ 'removed', 'no_filesystem', 'not_mounted', 'busy' ];

var callList = rpc.declare({ object: 'tarn_nas_diskmanager', method: 'list', reject: true });
var callRemoveDisk = rpc.declare({ object: 'tarn_nas_diskmanager', method: 'remove_disk', params: [ 'dev_name' ], reject: true });
var callSafeRemove = rpc.declare({ object: 'tarn_nas_diskmanager', method: 'safe_remove', reject: true });

function size(mib) {
	var units = [ 'MiB', 'GiB', 'TiB' ], unit = 0;

	while (mib >= 1024 && unit < 2) {
		mib /= 1024;
		unit++;
	}
	return '%s %s'.format(unit ? mib.toFixed(1) : mib, units[unit]);
}

function now() {
	return Date.now() / 1000;
}

function pause(seconds) {
	return new Promise(function(resolve) {
		window.setTimeout(resolve, seconds * 1000);
	});
}

function button(id, text, label, style, handler) {
	return E('button', {
		'id': id,
		'type': 'button',
		'class': 'btn cbi-button ' + style,
		'aria-label': label,
		'click': handler
	}, [ text ]);
}

/* All devices of the answer by the disk they are on: { name: { card, parts, unused } }, in the answer's order. */
function byDisk(answer) {
	var disks = {};

	answer.disk.forEach(function(disk) {
		disks[disk.dev_name] = { card: disk.sd_card, parts: disk.part, unused: [] };
	});
	answer.unused.forEach(function(device) {
		disks[device.disk] = disks[device.disk] || { card: null, parts: [], unused: [] };
		disks[device.disk].unused.push(device);
	});
	return disks;
}

/* True while something of the disk is mounted by the disk manager. */
function isMounted(disk) {
	return !!disk && (disk.parts.some(function(part) { return part.mounted; }) || isLeftBusy(disk));
}

/* True when the daemon has given up on a removal. */
function isLeftBusy(disk) {
	return disk.unused.some(function(device) { return device.reason == 'busy'; });
}

function mountedNames(disks) {
	return Object.keys(disks).filter(function(name) { return isMounted(disks[name]); });
}

function diskTitle(name, disk) {
	if (disk.card || name.indexOf('mmcblk') == 0)
		return _('SD card %s').format(name);
	if (name.indexOf('sd') == 0)
		return _('USB disk %s').format(name);
	return _('Disk %s').format(name);
}

/* What a person calls the disk: its labels beside its name. */
function diskLabels(name, disk) {
	var labels = disk.parts.map(function(part) { return part.label; }).filter(function(label) {
		return label.indexOf(name) != 0;
	});

	return labels.length ? '%s (%s)'.format(diskTitle(name, disk), labels.join(', ')) : diskTitle(name, disk);
}

return view.extend({
	handleSaveApply: null,
	handleSave: null,
	handleReset: null,

	load: function() {
		return callList().catch(function() { return null; });
	},

	render: function(answer) {
		this.mayRemove = L.hasViewPermission();
		this.shown = null;
		this.seen = null;
		this.removed = {};
		this.done = null;
		this.root = E('div');
		this.update(answer);
		poll.add(L.bind(this.lookIfSeen, this), POLL_SECONDS);
		document.addEventListener('visibilitychange', L.bind(this.lookIfSeen, this));

		return E('div', { 'class': 'cbi-map' }, [
			E('h2', {}, [ _('Disks') ]),
			E('div', { 'class': 'cbi-map-descr' }, [ _('USB disks and SD cards on this router. Remove a disk safely before you unplug it.') ]),
			this.root
		]);
	},

	/* Nobody is asked for a page that nobody sees. */
	lookIfSeen: function() {
		return document.hidden ? Promise.resolve() : this.look();
	},

	/* Shows what there is now; returns its disks, null when the router does not answer. */
	look: function() {
		return callList().then(L.bind(this.update, this), L.bind(this.update, this, null));
	},

	update: function(answer) {
		var disks = answer ? byDisk(answer) : null;
		var state;

		if (disks)
			this.remember(disks);
		state = JSON.stringify([ answer, this.removed, disks && Object.keys(disks).map(L.bind(this.isSettling, this)) ]);
		/* A page that is left alone keeps its focus, its selection and its place. */
		if (state != this.shown) {
			this.shown = state;
			this.replace(answer ? this.renderAnswer(answer, disks) : [ this.renderNotice(_('The router does not answer.'),
				_('The page tries again every few seconds. If the disk manager was just installed, log in again.')) ]);
		}
		return disks;
	},

	/* The focus stays on the button that has it, or the keyboard would start again at the top. */
	replace: function(children) {
		var id = this.root.contains(document.activeElement) ? document.activeElement.id : '';
		var again;

		dom.content(this.root, children);
		again = id ? document.getElementById(id) : null;
		if (again)
			again.focus();
	},

	/* Notes since when each disk is there, forgets removals of disks that have left or are back in use. */
	remember: function(disks) {
		var seen = {}, first = !this.seen, self = this;

		Object.keys(disks).forEach(function(name) {
			seen[name] = first ? 0 : (name in self.seen ? self.seen[name] : now());
		});
		this.seen = seen;

		Object.keys(this.removed).forEach(function(name) {
			if (!disks[name] || isMounted(disks[name]))
				delete self.removed[name];
		});
		if (this.done && this.done.some(function(name) { return isMounted(disks[name]); }))
			this.showBack();
	},

	isSettling: function(name) {
		return now() - this.seen[name] < SETTLE_SECONDS;
	},

	reasonOf: function(name, word) {
		if (SETTLING.indexOf(word) >= 0) {
			if (this.removed[name])
				return texts.reasons.unplug;
			if (this.isSettling(name))
				return texts.reasons.settling;
		}
		return texts.reasons[word] || [ word, '' ];
	},

	renderAnswer: function(answer, disks) {
		var names = Object.keys(disks), nodes = [];

		if (!answer.running)
			nodes.push(this.renderNotice(_('The disk manager is not running.'),
				_('Disks that are plugged in now are not mounted. Start "tarn_nas_diskmanager" under System, Startup, or restart the router.')));
		else if (!answer.published)
			nodes.push(this.renderNotice(_('The disk manager has not told yet which disks there are.'),
				_('If this lasts, the router may be out of memory: free some space in /tmp.')));

		if (!names.length)
			nodes.push(this.renderEmpty());
		if (this.mayRemove && answer.running && mountedNames(disks).length)
			nodes.push(E('div', { 'class': 'cbi-section' }, [
				button('remove-all', _('Remove all safely'), _('Remove all disks safely'), 'cbi-button-negative',
					L.bind(this.askAll, this, mountedNames(disks)))
			]));
		return nodes.concat(names.map(L.bind(function(name) {
			return this.renderDisk(name, disks[name], answer.running);
		}, this)));
	},

	renderNotice: function(text, advice) {
		return E('div', { 'class': 'alert-message warning', 'role': 'alert' }, [ E('h4', {}, [ text ]), E('p', {}, [ advice ]) ]);
	},

	renderEmpty: function() {
		return E('div', { 'class': 'cbi-section', 'id': 'no-disks' }, [
			E('p', {}, [ E('em', {}, [ _('No disk is plugged in.') ]) ]),
			E('p', {}, [ _('Plug a USB disk into a USB port, or put an SD card into its slot. It appears here within some 15 seconds.') ]),
			E('p', {}, [ _('After all disks were removed safely, a disk comes back when it is plugged in again.') ])
		]);
	},

	renderDisk: function(name, disk, running) {
		var rows = disk.parts.map(L.bind(this.renderPart, this, name)).concat(disk.unused.map(L.bind(this.renderUnused, this, name)));
		var title = diskTitle(name, disk);

		return E('div', { 'class': 'cbi-section', 'id': 'disk-' + name, 'role': 'region', 'aria-label': title }, [
			E('h3', {}, [ title ]),
			E('table', { 'class': 'table' }, [
				E('tr', { 'class': 'tr table-titles' }, [
					E('th', { 'class': 'th', 'style': 'width:22%' }, [ _('Label') ]),
					E('th', { 'class': 'th', 'style': 'width:25%' }, [ _('Directory') ]),
					E('th', { 'class': 'th', 'style': 'width:13%' }, [ _('Filesystem') ]),
					E('th', { 'class': 'th' }, [ _('Space') ])
				])
			].concat(rows)),
			this.mayRemove && running && isMounted(disk) ? E('div', { 'class': 'right' }, [
				button('remove-' + name, _('Remove safely'), _('Remove %s safely').format(title), 'cbi-button-remove',
					L.bind(this.askDisk, this, name, disk))
			]) : ''
		]);
	},

	renderRow: function(id, grey, label, directory, filesystem, space) {
		return E('tr', { 'class': 'tr', 'id': id, 'style': grey ? 'opacity:.65' : null }, [
			E('td', { 'class': 'td', 'data-title': _('Label'), 'style': 'overflow-wrap:anywhere' }, [ label ]),
			E('td', { 'class': 'td', 'data-title': _('Directory'), 'style': 'overflow-wrap:anywhere' }, [ directory ]),
			E('td', { 'class': 'td', 'data-title': _('Filesystem') }, [ filesystem ]),
			E('td', { 'class': 'td', 'data-title': _('Space') }, space)
		]);
	},

	renderPart: function(disk, part) {
		return this.renderRow('device-' + part.dev_name, !part.mounted, part.label, '/tmp/mountd/' + part.disk_name, part.fs_type,
			part.mounted ? this.renderBar(part) : this.renderReason(disk, part));
	},

	renderUnused: function(disk, device) {
		return this.renderRow('device-' + device.dev_name, true, device.dev_name, '-', '-', this.renderReason(disk, device));
	},

	renderBar: function(part) {
		var used = Math.max(0, part.total_len - part.free_size);
		var percent = part.total_len ? Math.round(100 * used / part.total_len) : 0;
		var text = _('%s free of %s').format(size(part.free_size), size(part.total_len));

		return [ E('div', {
			'class': 'cbi-progressbar',
			'title': text,
			'role': 'progressbar',
			'aria-label': _('Used space'),
			'aria-valuenow': percent,
			'aria-valuemin': 0,
			'aria-valuemax': 100,
			'aria-valuetext': text
		}, [ E('div', { 'style': 'width:' + percent + '%' }) ]) ];
	},

	renderReason: function(disk, device) {
		var reason = this.reasonOf(disk, device.reason);

		return [ E('strong', {}, [ reason[0] ]), ' ', reason[1], ' (' + size(device.total_len) + ')' ];
	},

	askDisk: function(name, disk) {
		this.ask(_('Remove safely'), _('Remove %s? It is no longer shared then, until it is plugged in again.').format(diskLabels(name, disk)),
			L.bind(this.remove, this, [ name ], L.bind(callRemoveDisk, null, name)));
	},

	askAll: function(names) {
		this.ask(_('Remove all safely'), _('Remove all disks? They are no longer shared then, until they are plugged in again.'),
			L.bind(this.remove, this, names, callSafeRemove));
	},

	ask: function(title, question, handler) {
		ui.showModal(title, [
			E('p', {}, [ question ]),
			E('div', { 'class': 'right' }, [
				button('cancel', _('Cancel'), null, '', ui.hideModal), ' ',
				button('confirm', _('Remove'), null, 'cbi-button-negative important', ui.createHandlerFn(this, handler))
			])
		]);
		document.getElementById('cancel').focus();
	},

	/* Asks the daemon to remove the disks of these names, and looks after it until nothing of them is mounted. */
	remove: function(names, call) {
		var begun = now();

		ui.showModal(_('Remove safely'), [
			E('p', { 'class': 'spinning', 'role': 'status' }, [ _('Waiting until nothing is written any more. Do not unplug yet.') ])
		]);
		this.done = null;
		return call().then(L.bind(function(answer) {
			/* Somebody else was faster. */
			if (answer.error == 'not_mounted')
				return this.showUnplug(names);
			if (!answer.ok)
				return this.showEnd('warning', texts.errors[answer.error] || answer.error);
			return this.wait(names, call, begun, begun);
		}, this)).catch(L.bind(function(error) {
			this.showEnd('warning', error.message);
		}, this));
	},

	wait: function(names, call, begun, asked) {
		return this.look().then(L.bind(function(disks) {
			var left = disks ? names.filter(function(name) { return isMounted(disks[name]); }) : names;

			if (!left.length)
				return this.showUnplug(names);
			if (now() - begun >= GIVE_UP_SECONDS)
				return this.showBusy();
			if (disks && now() - asked >= ASK_AGAIN_SECONDS && left.some(function(name) { return isLeftBusy(disks[name]); })) {
				asked = now();
				call().catch(function() {});
			}
			return pause(LOOK_SECONDS).then(L.bind(this.wait, this, names, call, begun, asked));
		}, this));
	},

	showUnplug: function(names) {
		var self = this;

		names.forEach(function(name) { self.removed[name] = true; });
		/* The rows behind it say so, too. */
		return this.look().then(function() {
			self.done = names;
			self.showEnd('success', names.length > 1 ? _('You can unplug them now.') : _('You can unplug it now.'));
		});
	},

	showBusy: function() {
		this.showEnd('warning', _('Still in use.'),
			_('A program has files open on the disk, so it could not be removed and data could be lost. Close what uses it, for example on computers that have it open over the network, and remove it again. Do not unplug it yet.'));
	},

	/* A disk that the daemon had not yet listed when it was removed is taken for a new one. */
	showBack: function() {
		this.showEnd('warning', _('The disk is in use again.'), _('It had only just been plugged in. Remove it once more. Do not unplug it yet.'));
		this.done = null;
	},

	/* Outcome of a removal; kind is a class of the theme's messages. */
	showEnd: function(kind, text, more) {
		ui.showModal(_('Remove safely'), [
			E('div', { 'class': 'alert-message ' + kind, 'role': 'status' }, [ E('strong', {}, [ text ]), more ? E('p', {}, [ more ]) : '' ]),
			E('div', { 'class': 'right' }, [ button('close', _('Close'), null, '', L.bind(this.close, this)) ])
		]);
		document.getElementById('close').focus();
	},

	close: function() {
		this.done = null;
		ui.hideModal();
	}
});
