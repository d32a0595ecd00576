/*
 * Stands in for LuCI in the tests and in the demo: the few of its calls that the page uses, with its dangers. E() takes a
 * bare string for HTML and only the strings of an array for text; a call without "reject" never fails.
 *
 * `session` comes from the server: id, view, readonly, words of the language.
 */
'use strict';

String.prototype.format = function() {
	var values = Array.prototype.slice.call(arguments);

	return this.replace(/%s/g, function() { return String(values.shift()); });
};

function _(text) {
	return session.words[text] || text;
}

var dom = {
	append: function(node, children) {
		if (Array.isArray(children))
			children.forEach(function(child) {
				node.appendChild(child instanceof Node ? child : document.createTextNode(String(child)));
			});
		else if (children instanceof Node)
			node.appendChild(children);
		else if (children !== null && children !== undefined)
			node.innerHTML = String(children);
	},

	content: function(node, children) {
		node.replaceChildren();
		dom.append(node, children);
	}
};

function E(tag, attributes, children) {
	var node = document.createElement(tag);

	Object.keys(attributes || {}).forEach(function(name) {
		if (typeof attributes[name] == 'function')
			node.addEventListener(name, attributes[name]);
		else if (attributes[name] != null)
			node.setAttribute(name, attributes[name]);
	});
	dom.append(node, children);
	return node;
}

var L = {
	bind: function(call, self) {
		return call.bind.apply(call, Array.prototype.slice.call(arguments, 1));
	},

	hasViewPermission: function() {
		return !session.readonly;
	}
};

var modal = E('div', { 'id': 'modal_overlay', 'tabindex': '-1' }, [ E('div', { 'class': 'modal', 'role': 'dialog', 'aria-modal': 'true' }) ]);
document.body.appendChild(modal);
modal.addEventListener('keydown', function(event) {
	var first = modal.querySelector('.right > button');

	if (event.key == 'Escape' && first)
		first.click();
});

var ui = {
	showModal: function(title, children) {
		dom.content(modal.firstChild, E('h4', {}, title));
		dom.append(modal.firstChild, children);
		document.body.classList.add('modal-overlay-active');
		modal.focus();
	},

	hideModal: function() {
		document.body.classList.remove('modal-overlay-active');
		modal.blur();
	},

	createHandlerFn: function(self, call) {
		return function(event) {
			var target = event.currentTarget;

			target.classList.add('spinning');
			target.disabled = true;
			return Promise.resolve(call.call(self, event)).finally(function() {
				target.classList.remove('spinning');
				target.disabled = false;
			});
		};
	}
};

var rpc = {
	declare: function(method) {
		return function() {
			var values = {}, given = arguments;

			(method.params || []).forEach(function(name, index) { values[name] = given[index]; });
			return rpc.call(method, [ session.id, method.object, method.method, values ]);
		};
	},

	call: function(method, params) {
		return fetch('ubus', {
			method: 'POST',
			body: JSON.stringify({ jsonrpc: '2.0', id: 1, method: 'call', params: params })
		}).then(function(response) { return response.json(); }).then(function(message) {
			if (message.error)
				throw new Error(message.error.message);
			if (method.reject && message.result[0] !== 0)
				throw new Error('ubus code ' + message.result[0]);
			return message.result.length > 1 ? message.result[1] : message.result[0];
		});
	}
};

var poll = {
	add: function(call, seconds) {
		window.setInterval(call, seconds * 1000);
	}
};

var classes = { dom: dom, poll: poll, rpc: rpc, ui: ui, view: {}, baseclass: {} };
classes.view.extend = classes.baseclass.extend = function(members) {
	return members;
};

/* Loads a class and what its first lines require. */
function load(name) {
	if (classes[name])
		return Promise.resolve(classes[name]);
	return fetch('luci-static/resources/' + name.replace(/\./g, '/') + '.js').then(function(response) {
		return response.text();
	}).then(function(source) {
		var required = Array.from(source.matchAll(/^'require ([\w.]+)(?: as (\w+))?';$/gm));

		return Promise.all(required.map(function(line) { return load(line[1]); })).then(function(values) {
			var names = required.map(function(line) { return line[2] || line[1]; });

			classes[name] = Function.apply(null, [ 'window', 'document', 'L' ].concat(names, source))
				.apply(null, [ window, document, L ].concat(values));
			return classes[name];
		});
	});
}

load('view.' + session.view.replace(/\//g, '.')).then(function(page) {
	return Promise.resolve(page.load()).then(function(data) {
		dom.content(document.getElementById('view'), page.render(data));
	});
}).catch(function(error) {
	document.getElementById('view').textContent = 'The page does not load: ' + error;
});
